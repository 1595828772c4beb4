// The trusted application beside bare libcrypto. All ways of all cases run in one process, in
// random order and several times; the table shows medians. --benchmark_out=FILE writes them as
// JSON.
#include <benchmark/benchmark.h>
#include <cstdio>
#include <cstring>
#include <map>
#include <optional>
#include <stdlib.h>

#include "bench/cases.h"

namespace keymaster::bench {
namespace {

constexpr const char* SECURE = "TA";
constexpr const char* LOADED = "loaded";
constexpr const char* CHAIN = "chain";

void add(const std::string& name, const std::string& way, const std::function<void()>& run) {
  if (!run) return;
  benchmark::RegisterBenchmark((name + "/" + way).c_str(), [run](benchmark::State& state) {
    for (auto _ : state)
      run();
  });
}

// median_table: prints one line a case when everything has run.
class median_table : public benchmark::BenchmarkReporter {
 public:
  bool ReportContext(const Context&) override { return true; }

  void ReportRuns(const std::vector<Run>& runs) override {
    for (const Run& run : runs) {
      const bool median = run.run_type == Run::RT_Aggregate && run.aggregate_name == "median";
      const bool only = run.run_type == Run::RT_Iteration && run.repetitions == 1;
      if (!median && !only) continue;
      const std::string& name = run.run_name.function_name;
      const size_t slash = name.rfind('/');
      medians_[name.substr(0, slash)][name.substr(slash + 1)] = run.GetAdjustedCPUTime() / 1000;
      fprintf(stderr, ".");
    }
  }

  void Finalize() override {
    fprintf(stderr, "\n");
    printf("%-24s %12s %12s %12s %12s %12s\n", "medians, microseconds", SECURE, LOADED, CHAIN,
           "loaded/TA", "chain/TA");
    for (const std::string& name : order_)
      if (medians_.count(name) != 0) print_case(name, medians_.at(name));
  }

  // In which order the table shows the cases.
  void expect(const std::string& name) { order_.push_back(name); }

 private:
  using ways = std::map<std::string, double>;

  static void print_case(const std::string& name, const ways& times) {
    const auto value = [&](const char* way) -> std::optional<double> {
      const auto found = times.find(way);
      return found == times.end() ? std::nullopt : std::optional(found->second);
    };
    const auto column = [](std::optional<double> number) {
      number ? printf(" %12.2f", *number) : printf(" %12s", "-");
    };
    const auto ratio = [&](const char* way) {
      const auto time = value(way);
      const auto secure = value(SECURE);
      return time && secure ? std::optional(*time / *secure) : std::nullopt;
    };
    printf("%-24s", name.c_str());
    for (const auto& number :
         {value(SECURE), value(LOADED), value(CHAIN), ratio(LOADED), ratio(CHAIN)}) {
      column(number);
    }
    printf("\n");
  }

  std::vector<std::string> order_;
  std::map<std::string, ways> medians_;
};

int run(int count, char** given) {
  // Short turns, so that what disturbs the machine for a moment meets all ways alike. Given
  // arguments come last, so that they win.
  std::vector<std::string> arguments = {given[0], "--benchmark_repetitions=49",
                                        "--benchmark_enable_random_interleaving=true",
                                        "--benchmark_min_time=0.005"};
  arguments.insert(arguments.end(), given + 1, given + count);
  std::vector<char*> pointers;
  for (std::string& argument : arguments)
    pointers.push_back(argument.data());
  int left = static_cast<int>(pointers.size());
  benchmark::Initialize(&left, pointers.data());
  if (benchmark::ReportUnrecognizedArguments(left, pointers.data())) return 2;

  setenv("TEE_TRACE_LEVEL", "0", 0);  // that the device has no replay-protected storage is no news
  secure_world world;
  median_table table;
  std::vector<bench_case> cases = symmetric_cases(&world);
  for (bench_case& more : asymmetric_cases(&world))
    cases.push_back(std::move(more));
  for (const bench_case& one : cases) {
    table.expect(one.name);
    add(one.name, SECURE, one.secure);
    add(one.name, LOADED, one.loaded);
    add(one.name, CHAIN, one.chain);
  }
  benchmark::RunSpecifiedBenchmarks(&table);
  benchmark::ClearRegisteredBenchmarks();  // they hold sessions of `world`
  return 0;
}

}  // namespace
}  // namespace keymaster::bench

int main(int argc, char** argv) {
  try {
    return keymaster::bench::run(argc, argv);
  } catch (const std::exception& error) {
    fprintf(stderr, "%s\n", error.what());
    return 1;
  }
}
