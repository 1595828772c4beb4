// The folder of a device. The kernel's lock on the folder itself decides who has it, and ends with
// the process however it ends.
#include "tee/device/folder.h"

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <sys/stat.h>
#include <unistd.h>

#include "tee/device/os_open.h"

namespace tee {

namespace {

constexpr mode_t OTHERS = 0077;

// Who may read or change a file is what keeps a device's secrets, so it is looked at as ssh does.
void check_access(const struct stat& status, const std::string& path, const char* mode) {
  if (status.st_uid != geteuid()) {
    throw device_error(device_error::kind::EXPOSED, path + " belongs to another user (id " +
                                                        std::to_string(status.st_uid) +
                                                        "); only the owner of a device can use it");
  }
  if ((status.st_mode & OTHERS) != 0) {
    throw device_error(device_error::kind::EXPOSED, path + " is open to other users; 'chmod " +
                                                        mode + " " + path + "' closes it");
  }
}

// The process that holds the lock of an inode; 0 when the kernel does not say. A line of
// /proc/locks: number, kind, strictness, access, process, device:inode, first and last byte.
long holder_of(ino_t inode) {
  std::ifstream locks("/proc/locks");
  const std::string end = ":" + std::to_string(inode);
  for (std::string line; std::getline(locks, line);) {
    std::istringstream words(line);
    std::string number, kind, strictness, access, place;
    long process = 0;
    words >> number >> kind >> strictness >> access >> process >> place;
    if (kind == "FLOCK" && place.ends_with(end) && process > 0) return process;
  }
  return 0;
}

}  // namespace

device_folder::device_folder(const std::string& path)
    : path_(path), fd_(os::open_folder(path.c_str())) {
  if (!fd_ && (errno == ENOENT || errno == ENOTDIR)) {
    throw device_error(device_error::kind::NOT_FOUND, "there is no device at " + path);
  }
  if (!fd_) throw file_error("open", path);
}

void device_folder::require_private() const {
  struct stat status {};
  if (fstat(fd_.get(), &status) != 0) throw file_error("open", path_);
  check_access(status, path_, "700");
}

void device_folder::throw_busy(int held) const {
  if (errno != EWOULDBLOCK) throw file_error("lock", path_);
  struct stat status {};
  long holder = fstat(held, &status) == 0 ? holder_of(status.st_ino) : 0;
  throw device_error(device_error::kind::BUSY,
                     "device " + path_ + " is in use by " +
                         (holder != 0 ? "process " + std::to_string(holder) : "another process"));
}

void device_folder::lock() {
  if (os::lock_file(fd_.get()) != 0) throw_busy(fd_.get());
}

std::optional<file_descriptor> device_folder::lock_file(const std::string& name) const {
  auto file = open(name);
  if (file && os::lock_file(file->get()) != 0) throw_busy(file->get());
  return file;
}

void device_folder::require_writable() const {
  if (!os::may_write(fd_.get())) throw file_error("write to", path_);
}

bool device_folder::is_at(const std::string& path) const {
  struct stat here {};
  struct stat there {};
  return fstat(fd_.get(), &here) == 0 && stat(path.c_str(), &there) == 0 &&
         here.st_dev == there.st_dev && here.st_ino == there.st_ino;
}

std::optional<file_descriptor> device_folder::open(const std::string& name) const {
  const std::string shown = path_of(name);
  file_descriptor file(os::open_file(name.c_str(), os::open_mode::READ_OWN, fd_.get()));
  if (!file && errno == ENOENT) return std::nullopt;
  struct stat status {};
  if (!file || fstat(file.get(), &status) != 0) throw file_error("open", shown);
  if (!S_ISREG(status.st_mode)) {
    throw device_error(device_error::kind::DAMAGED, shown + " is not a regular file");
  }
  check_access(status, shown, "600");
  return file;
}

bool device_folder::has(const std::string& name) const {
  struct stat status {};
  return fstatat(fd_.get(), name.c_str(), &status, 0) == 0 || errno != ENOENT;
}

bool device_folder::contains(const std::string& name) const {
  return open(name).has_value();
}

std::optional<secret_bytes> device_folder::read(const std::string& name, size_t limit) const {
  auto file = open(name);
  if (!file) return std::nullopt;
  return read_all(*file, limit, path_of(name));
}

void device_folder::write(const std::string& name, std::span<const uint8_t> bytes) const {
  const std::string draft = name + ".new";
  {
    file_descriptor file(os::open_file(draft.c_str(), os::open_mode::REPLACE, fd_.get()));
    if (!file) throw file_error("create", path_of(draft));
    write_all(file, bytes, path_of(draft));
    if (fsync(file.get()) != 0) throw file_error("sync", path_of(draft));
  }
  if (renameat(fd_.get(), draft.c_str(), fd_.get(), name.c_str()) != 0) {
    throw file_error("replace", path_of(name));
  }
  sync();
}

void device_folder::remove(const std::string& name) const {
  if (unlinkat(fd_.get(), name.c_str(), 0) != 0 && errno != ENOENT) {
    throw file_error("remove", path_of(name));
  }
  sync();
}

void device_folder::sync() const {
  if (fsync(fd_.get()) != 0) throw file_error("sync", path_);
}

std::string device_folder::path_through(const std::string& name) const {
  return "/proc/self/fd/" + std::to_string(fd_.get()) + "/" + name;
}

void sync_parent(const std::string& path) {
  const std::filesystem::path parent = std::filesystem::path(path).parent_path();
  file_descriptor folder(os::open_folder(parent.empty() ? "." : parent.c_str()));
  if (!folder || fsync(folder.get()) != 0) throw file_error("sync", parent);
}

namespace {

// The folders that lead to `path`.
void make_parents(const std::string& path) {
  const std::filesystem::path parent = std::filesystem::path(path).parent_path();
  std::error_code failed;
  if (parent.empty() || std::filesystem::is_directory(parent, failed)) return;
  make_parents(parent);
  if (mkdir(parent.c_str(), 0777) != 0 && errno != EEXIST) throw file_error("create", parent);
  sync_parent(parent);
}

void move_into_place(const std::string& draft, const std::string& folder) {
  if (std::rename(draft.c_str(), folder.c_str()) != 0) {
    if (errno == ENOTEMPTY || errno == EEXIST || errno == ENOTDIR) {
      throw device_error(device_error::kind::EXISTS, folder + " exists already");
    }
    throw file_error("create", folder);
  }
  sync_parent(folder);
}

// The path without what does not change it, such as a slash at its end.
std::string tidy(const std::string& path) {
  std::filesystem::path tidied = std::filesystem::path(path).lexically_normal();
  return tidied.has_filename() ? tidied : tidied.parent_path();
}

}  // namespace

void make_device_folder(const std::string& path,
                        const std::function<void(const device_folder&)>& fill) {
  const std::string folder = tidy(path);
  make_parents(folder);
  std::string draft = folder + ".new-XXXXXX";
  if (mkdtemp(draft.data()) == nullptr) throw file_error("create", folder);
  try {
    fill(device_folder(draft));
    move_into_place(draft, folder);
  } catch (...) {
    std::error_code failed;
    std::filesystem::remove_all(draft, failed);
    throw;
  }
}

}  // namespace tee
