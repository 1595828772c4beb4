// What is measured.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "bench/secure_world.h"

namespace keymaster::bench {

// bench_case: one piece of work, done three ways. A way that makes no sense for it is empty.
struct bench_case {
  std::string name;
  std::function<void()> secure;  // the trusted application, all commands that the work takes
  std::function<void()> loaded;  // the bare primitive, with its key loaded before
  std::function<void()> chain;   // bare libcrypto from the blob on: open it, load the key, operate
};

// symmetric_cases, asymmetric_cases: the cases, each of which has shown that its ways agree.
// std::runtime_error when they do not. They refer to `world`.
std::vector<bench_case> symmetric_cases(secure_world* world);
std::vector<bench_case> asymmetric_cases(secure_world* world);

}  // namespace keymaster::bench
