// The folder of a device: opened once, and from then on reached through its descriptor alone, so
// that whatever is done to its path, what was opened is what is read and written.
#pragma once

#include <functional>
#include <optional>
#include <span>
#include <string>

#include "tee/device/files.h"

namespace tee {

// Every file in it is the device's own: a regular file of the effective user that nobody else may
// read or write; another one is refused (device_error EXPOSED, which says what to do).
class device_folder {
 public:
  // Opens the folder `path`. Throws device_error: NOT_FOUND when there is none, else file_error.
  explicit device_folder(const std::string& path);

  // require_private: throws EXPOSED when the folder is another user's or open to others.
  void require_private() const;

  const std::string& path() const { return path_; }
  std::string path_of(const std::string& name) const { return path_ + "/" + name; }

  // lock: takes the folder for this object until it is destroyed. BUSY, naming the holder's process
  // id, while someone else (in this process, too) holds it.
  void lock();

  // lock_file: takes one of its files likewise, if it is there.
  std::optional<file_descriptor> lock_file(const std::string& name) const;

  // require_writable: throws file_error unless files can be replaced here.
  void require_writable() const;

  // is_at: whether `path` leads here.
  bool is_at(const std::string& path) const;

  // has: whether there is anything of that name. contains: the same for a file, checked as all are.
  bool has(const std::string& name) const;
  bool contains(const std::string& name) const;

  // read: the content of a file; nothing when there is none. DAMAGED when it is longer than `limit`
  // bytes or no regular file.
  std::optional<secret_bytes> read(const std::string& name, size_t limit) const;

  // write: makes the file hold exactly `bytes` (mode 0600), durably. After a failure or a power cut
  // at any point it holds its old content or the new one. One writer at a time.
  void write(const std::string& name, std::span<const uint8_t> bytes) const;

  // remove: durably; a file that is not there is no error.
  void remove(const std::string& name) const;

  // sync: makes the names in the folder durable.
  void sync() const;

  // path_through: a path to the file that goes through the descriptor. For libraries that take
  // paths; valid while this object lives.
  std::string path_through(const std::string& name) const;

 private:
  std::optional<file_descriptor> open(const std::string& name) const;
  [[noreturn]] void throw_busy(int held) const;

  std::string path_;
  file_descriptor fd_;
};

// make_device_folder: makes the folder `path` (mode 0700) with what `fill` puts into it, and the
// folders that lead there, durably. It appears complete or not at all. EXISTS unless nothing or an
// empty folder is there.
void make_device_folder(const std::string& path,
                        const std::function<void(const device_folder&)>& fill);

// sync_parent: makes the name `path` durable.
void sync_parent(const std::string& path);

}  // namespace tee
