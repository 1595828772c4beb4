// What it costs that another process has the device: the same operations with the TEE in the
// process and served, beside one bare round trip of 200 bytes between two processes. Real time, in
// random order and several times; the medians count.
#include <array>
#include <benchmark/benchmark.h>
#include <cstdlib>
#include <stdexcept>
#include <string>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

#include "bench/secure_world.h"
#include "tee/device/file_descriptor.h"

namespace keymaster::bench {
namespace {

constexpr size_t PACKET = 200;
constexpr size_t SMALL = 64;
constexpr size_t BULK = size_t{16} << 20;
constexpr uint32_t KEY_BITS = 256;
constexpr uint32_t MAC_BITS = 128;

// A process that sends back what it gets.
class echo_process {
 public:
  echo_process() {
    std::array<int, 2> ends{};
    if (socketpair(AF_UNIX, SOCK_SEQPACKET, 0, ends.data()) != 0) throw std::bad_alloc();
    own_ = tee::file_descriptor(ends[0]);
    const tee::file_descriptor other(ends[1]);
    child_ = fork();
    if (child_ != 0) return;
    own_ = {};
    std::array<char, PACKET> packet{};
    while (read(other.get(), packet.data(), PACKET) > 0 &&
           write(other.get(), packet.data(), PACKET) > 0) {
    }
    _exit(0);
  }
  echo_process(const echo_process&) = delete;
  echo_process& operator=(const echo_process&) = delete;
  ~echo_process() {
    own_ = {};
    waitpid(child_, nullptr, 0);
  }

  void run() const {
    std::array<char, PACKET> packet{};
    if (write(own_.get(), packet.data(), PACKET) <= 0 ||
        read(own_.get(), packet.data(), PACKET) <= 0)
      throw std::runtime_error("the other process is gone");
  }

 private:
  tee::file_descriptor own_;
  pid_t child_ = 0;
};

operation hmac_of(secure_world* world, const bytes& data) {
  const bytes blob = world->generate_key(param_set()
                                             .add(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC)
                                             .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
                                             .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)
                                             .add(KM_TAG_KEY_SIZE, KEY_BITS)
                                             .add(KM_TAG_MIN_MAC_LENGTH, MAC_BITS)
                                             .add_flag(KM_TAG_NO_AUTH_REQUIRED));
  const param_set use =
      param_set().add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256).add(KM_TAG_MAC_LENGTH, MAC_BITS);
  return {world, KM_PURPOSE_SIGN, blob, use, data};
}

operation gcm_of(secure_world* world, const bytes& data) {
  const bytes blob = world->generate_key(param_set()
                                             .add(KM_TAG_ALGORITHM, KM_ALGORITHM_AES)
                                             .add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT)
                                             .add(KM_TAG_BLOCK_MODE, KM_MODE_GCM)
                                             .add(KM_TAG_PADDING, KM_PAD_NONE)
                                             .add(KM_TAG_KEY_SIZE, KEY_BITS)
                                             .add(KM_TAG_MIN_MAC_LENGTH, MAC_BITS)
                                             .add_flag(KM_TAG_NO_AUTH_REQUIRED));
  const param_set use = param_set()
                            .add(KM_TAG_BLOCK_MODE, KM_MODE_GCM)
                            .add(KM_TAG_PADDING, KM_PAD_NONE)
                            .add(KM_TAG_MAC_LENGTH, MAC_BITS);
  return {world, KM_PURPOSE_ENCRYPT, blob, use, data};
}

template <typename Work>
void add(const std::string& name, Work* work) {
  benchmark::RegisterBenchmark(name.c_str(), [work](benchmark::State& state) {
    for (auto _ : state)
      work->run();
  })->UseRealTime();
}

int run(int argc, char** argv) {
  const echo_process other;  // before there are threads
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return EXIT_FAILURE;
  secure_world local("local:");
  secure_world served("teed:");
  const bytes small = pattern(SMALL);
  const bytes bulk = pattern(BULK);
  operation local_hmac = hmac_of(&local, small);
  operation served_hmac = hmac_of(&served, small);
  operation local_gcm = gcm_of(&local, bulk);
  operation served_gcm = gcm_of(&served, bulk);
  add("round trip, 200 bytes", &other);
  add("HMAC 64B, 3 commands/local", &local_hmac);
  add("HMAC 64B, 3 commands/served", &served_hmac);
  add("AES-GCM 16MiB/local", &local_gcm);
  add("AES-GCM 16MiB/served", &served_gcm);
  benchmark::RunSpecifiedBenchmarks();
  return EXIT_SUCCESS;
}

}  // namespace
}  // namespace keymaster::bench

int main(int argc, char** argv) {
  // Before any flag of the caller's, which may say otherwise.
  std::string interleave = "--benchmark_enable_random_interleaving=true";
  std::string medians = "--benchmark_report_aggregates_only=true";
  std::vector<char*> arguments = {argv[0], interleave.data(), medians.data()};
  arguments.insert(arguments.end(), argv + 1, argv + argc);
  return keymaster::bench::run(static_cast<int>(arguments.size()), arguments.data());
}
