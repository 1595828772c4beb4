// Files of the command line: streamed in, written whole or not at all. "-" is standard input or
// output. Every function throws failure (WRONG_USAGE) that names the file and the reason.
#pragma once

#include <optional>
#include <span>
#include <string>
#include <sys/types.h>

#include "keymaster/client/bytes.h"
#include "output_file.h"

namespace kmtool {

using keymaster::client::byte_view;
using keymaster::client::bytes;

// open_standard_streams: puts something in place of standard streams that the caller closed, whose
// numbers would go to the next files that are opened. It can neither be read nor written.
void open_standard_streams();

// input_file: a file that is read from its start to its end.
class input_file {
 public:
  explicit input_file(const std::string& path);
  input_file(const input_file&) = delete;
  input_file& operator=(const input_file&) = delete;
  ~input_file();

  // read: fills `room` as far as the file goes; the number of bytes, 0 at its end.
  size_t read(std::span<uint8_t> room);

  // size: length of a regular file in bytes; nothing for pipes, terminals and the like.
  std::optional<uint64_t> size() const { return size_; }

 private:
  std::string path_;
  int fd_;
  std::optional<uint64_t> size_;
};

constexpr size_t MAX_KEY_FILE = 1024 * 1024;
constexpr size_t MAX_SIGNATURE_FILE = 64 * 1024;

// read_file: the whole content, at least one byte; refuses files of more than `limit` bytes.
bytes read_file(const std::string& path, size_t limit = MAX_KEY_FILE);

// write_file: makes `path` hold exactly `data`. After a failure or a power cut it holds its old
// content or the new one. A link is followed; a pipe or device is written to as it is.
void write_file(const std::string& path, byte_view data, access mode);

// refuse_overwriting: throws when a file is at `path`, unless that is `source` itself.
void refuse_overwriting(const std::string& path, const std::string& source = "");

}  // namespace kmtool
