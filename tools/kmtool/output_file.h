// A file that is written piece by piece and appears whole, or not at all.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "keymaster/client/bytes.h"

namespace kmtool {

// PRIVATE files (mode 0600) are for the user's eyes alone; others follow the umask.
enum class access { PRIVATE, NORMAL };

// output_file: "-" is standard output, which gets every piece at once, as pipes and devices do. A
// regular file gets its name with commit; until then, and if it never comes, the old one stays. A
// link is followed. Every function throws failure (WRONG_USAGE) that names the file and the reason.
class output_file {
 public:
  explicit output_file(const std::string& path, access mode = access::NORMAL);
  output_file(const output_file&) = delete;
  output_file& operator=(const output_file&) = delete;
  ~output_file();

  void write(keymaster::client::byte_view data);
  // Makes the content durable and gives the file its name.
  void commit();

  uint64_t written() const { return written_; }

 private:
  std::string name_;       // as messages give it
  std::string target_;     // of a regular file; empty when it is written in place
  std::string temporary_;  // its name until commit
  access mode_;
  int fd_ = -1;
  uint64_t written_ = 0;
};

}  // namespace kmtool
