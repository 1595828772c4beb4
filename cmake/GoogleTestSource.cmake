# GoogleTest for cross builds: no distribution ships it compiled for the target, so its sources are
# built here. They come with the package googletest; native builds use the installed library.
set(GOOGLETEST_SOURCE /usr/src/googletest/googletest CACHE PATH "Sources of GoogleTest")

if(CMAKE_CROSSCOMPILING)
  if(NOT EXISTS ${GOOGLETEST_SOURCE}/src/gtest-all.cc)
    message(FATAL_ERROR "No GoogleTest sources in ${GOOGLETEST_SOURCE}: run scripts/setup.sh --tests")
  endif()
  find_package(Threads REQUIRED)
  add_library(gtest_main STATIC EXCLUDE_FROM_ALL
      ${GOOGLETEST_SOURCE}/src/gtest-all.cc ${GOOGLETEST_SOURCE}/src/gtest_main.cc)
  target_compile_options(gtest_main PRIVATE -w)
  target_include_directories(gtest_main SYSTEM PUBLIC ${GOOGLETEST_SOURCE}/include
                             PRIVATE ${GOOGLETEST_SOURCE})
  target_link_libraries(gtest_main PUBLIC Threads::Threads)
  add_library(GTest::gtest_main ALIAS gtest_main)
endif()
