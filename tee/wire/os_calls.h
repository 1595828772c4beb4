// Calls of the system whose headers lead to <fcntl.h>, which declares a function named tee, as this
// project's namespace is called: memory that two processes share and neither can shrink, folders,
// processes.
#pragma once

#include <cstddef>
#include <sys/types.h>

namespace os {

// make_shared_memory: a descriptor, closed on exec, of `size` zero bytes whose size is fixed for
// good; -1 with errno.
int make_shared_memory(size_t size);

// is_fixed_memory: whether the descriptor is memory whose size nobody can change, of at least
// `size` bytes, so that a mapping of it can always be read and written.
bool is_fixed_memory(int fd, size_t size);

// open_place: a folder's descriptor through which paths can be looked up; closed on exec; -1 with
// errno.
int open_place(const char* path);

// open_process: a descriptor, closed on exec, that becomes readable when the process ends; -1 with
// errno.
int open_process(pid_t process);

}  // namespace os
