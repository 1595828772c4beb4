# Warnings and sanitizers that hold for every target.
add_compile_options(-Wall -Wextra -Wshadow -Wconversion -Wold-style-cast -Wformat=2 -Werror)
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  # The platform's in/out lengths meet spans everywhere; these two see phantom overflows there.
  add_compile_options(-Wno-stringop-overflow -Wno-array-bounds)
endif()

if(KEYMASTER_SANITIZE)
  add_compile_options(-fsanitize=${KEYMASTER_SANITIZE} -fno-omit-frame-pointer
                      -fno-sanitize-recover=all)
  add_link_options(-fsanitize=${KEYMASTER_SANITIZE})
  # The vptr check needs RTTI, which TA code does without.
  add_compile_options(-fno-sanitize=vptr)
endif()
