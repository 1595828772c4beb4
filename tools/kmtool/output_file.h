// A file that is written piece by piece and appears whole, or not at all.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <sys/types.h>

#include "keymaster/client/bytes.h"

namespace kmtool {

// PRIVATE files (mode 0600) are for the user's eyes alone; others follow the umask. A file that is
// replaced keeps its mode and its owner.
enum class access { PRIVATE, NORMAL };

// output_file: "-" is standard output, which gets every piece at once, as pipes and devices do. A
// regular file gets its name with commit; until then, and if it never comes, the old one stays, and
// nothing else when a signal ends the tool. A link is followed. Every function throws failure
// (WRONG_USAGE) that names the file and the reason.
class output_file {
 public:
  explicit output_file(const std::string& path, access mode = access::NORMAL);
  output_file(const output_file&) = delete;
  output_file& operator=(const output_file&) = delete;
  ~output_file();

  void write(keymaster::client::byte_view data);
  // Makes the content durable and gives the file its name. Fails, too, when the owner of the file
  // that is replaced cannot stay.
  void commit();

  uint64_t written() const { return written_; }

 private:
  void keep_owner();

  std::string name_;       // as messages give it
  std::string target_;     // of a regular file; empty when it is written in place
  std::string temporary_;  // its name until commit
  mode_t mode_;
  std::optional<uid_t> owner_;  // of the file that is replaced
  gid_t group_ = 0;
  int fd_ = -1;
  uint64_t written_ = 0;
};

// leave_nothing_behind: has the signals that end the tool (SIGHUP, SIGINT, SIGTERM, SIGPIPE; not
// those that the caller ignores) remove what is not committed.
void leave_nothing_behind();

}  // namespace kmtool
