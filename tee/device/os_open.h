// Opening and locking files. The C library's <fcntl.h> declares a function named tee, so no file
// that knows this project's namespace of that name can include it; what is needed of it is here.
#pragma once

namespace os {

// The folder that relative paths begin in, where a call takes a folder's descriptor.
extern const int CURRENT_FOLDER;

enum class open_mode {
  READ,      // an existing file; a pipe or terminal in its place does not block
  READ_OWN,  // the same, and the path's last part is no symbolic link
  REPLACE,   // a new or emptied file to write, mode 0600, no symbolic link
  CREATE     // a new file to write, mode 0600
};

// open_file: `path` seen from the folder `at`; a descriptor that is closed on exec, or -1 with
// errno.
int open_file(const char* path, open_mode mode, int at = CURRENT_FOLDER);

// open_folder: likewise, to look up names in it.
int open_folder(const char* path, int at = CURRENT_FOLDER);

// may_write: whether the effective user may make and replace files in the open folder; false with
// errno.
bool may_write(int folder);

// lock_file: takes the file or folder for this descriptor alone (flock) without waiting; 0, or -1
// with errno, EWOULDBLOCK when another descriptor has it.
int lock_file(int fd);

}  // namespace os
