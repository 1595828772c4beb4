// Memory that two processes share and neither can shrink. Apart from the rest for <fcntl.h>, which
// declares a function named tee, as this project's namespace is called.
#pragma once

#include <cstddef>

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

}  // namespace os
