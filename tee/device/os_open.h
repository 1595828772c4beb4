// Opening and locking files. The C library's <fcntl.h> declares a function named tee, so no file
// that knows this project's namespace of that name can include it; what is needed of it is here.
#pragma once

namespace os {

enum class open_mode {
  READ,      // an existing file; a pipe or terminal in its place does not block
  REPLACE,   // a new or emptied file to write, mode 0600
  READWRITE  // a new or existing file, mode 0600
};

// open_file, open_folder: a descriptor that is closed on exec, or -1 with errno. Symbolic links are
// followed for reading only.
int open_file(const char* path, open_mode mode);
int open_folder(const char* path);

// lock_file: takes the file for this descriptor alone (flock) without waiting; 0, or -1 with errno,
// EWOULDBLOCK when another descriptor has it.
int lock_file(int fd);

}  // namespace os
