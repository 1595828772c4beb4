# Warnings and sanitizers that hold for every target.
add_compile_options(-Wall -Wextra -Wshadow -Wconversion -Wold-style-cast -Wformat=2 -Werror)
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  # The platform's in/out lengths meet spans everywhere; the first two see phantom overflows there.
  # The third takes an empty std::optional for a forgotten initialisation; lint looks for real ones.
  add_compile_options(-Wno-stringop-overflow -Wno-array-bounds -Wno-maybe-uninitialized)
endif()

# Shared objects name all that they need. Clang links a sanitizer's runtime into programs only, so
# there a shared object's calls into it stay open.
set(KEYMASTER_NO_UNDEFINED -Wl,--no-undefined)
if(KEYMASTER_SANITIZE AND CMAKE_CXX_COMPILER_ID MATCHES "Clang")
  set(KEYMASTER_NO_UNDEFINED "")
endif()

if(KEYMASTER_SANITIZE)
  add_compile_options(-fsanitize=${KEYMASTER_SANITIZE} -fno-omit-frame-pointer
                      -fno-sanitize-recover=all)
  add_link_options(-fsanitize=${KEYMASTER_SANITIZE})
  # The vptr check needs RTTI, which TA code does without.
  add_compile_options(-fno-sanitize=vptr)
endif()
