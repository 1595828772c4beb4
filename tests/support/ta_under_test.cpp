#include "support/ta_under_test.h"

#include <algorithm>
#include <filesystem>
#include <stdlib.h>

#include "support/ta_folders.h"

namespace keymaster::test {
namespace {

using tee::host::live_counts;

// In memory where there is such a folder, since every start of a device syncs files.
std::string make_folder() {
  const std::filesystem::path memory = "/dev/shm";
  const auto parent =
      std::filesystem::exists(memory) ? memory : std::filesystem::temp_directory_path();
  std::string path = (parent / "keymaster-test-XXXXXX").string();
  if (mkdtemp(path.data()) == nullptr) throw std::runtime_error("no temporary folder");
  return path;
}

// The types word that the command wants.
uint32_t default_types(uint32_t id) {
  static const std::map<uint32_t, uint32_t> OTHERS = {
      {14, 0x53},  {21, 0x53},  {22, 0x3},       {23, 0x3},       {25, 0x53},
      {0xFF00, 3}, {0xFF01, 3}, {0xFF02, 0x602}, {0xFF03, 0x602}, {0xFF04, 0x50}};
  const auto other = OTHERS.find(id);
  return other == OTHERS.end() ? 0x653 : other->second;
}

bool is_memory(uint32_t types, int slot) {
  return (types >> (4 * slot) & 0xF) >= TEEC_MEMREF_TEMP_INPUT;
}

live_counts difference(const live_counts& a, const live_counts& b) {
  return {a.heap_bytes - b.heap_bytes, a.heap_blocks - b.heap_blocks, a.objects - b.objects,
          a.operations - b.operations, a.sessions - b.sessions};
}

std::string text(const live_counts& counts) {
  return std::to_string(counts.heap_bytes) + " bytes in " + std::to_string(counts.heap_blocks) +
         " blocks, " + std::to_string(counts.objects) + " objects, " +
         std::to_string(counts.operations) + " operations, " + std::to_string(counts.sessions) +
         " sessions";
}

testing::AssertionResult judge(bool as_wanted, const reply& answer) {
  const client::status outcome{answer.res, answer.origin, answer.km_error};
  return (as_wanted ? testing::AssertionSuccess() : testing::AssertionFailure()) << outcome.text();
}

// Input and output of a command, in heap blocks of exactly their size: one each, or one for both
// where they share memory.
class memory {
 public:
  explicit memory(const request& what) {
    const auto at = what.output_at.value_or(0);
    const size_t in_front = at < 0 ? static_cast<size_t>(-at) : 0;
    const size_t behind = at < 0 ? 0 : static_cast<size_t>(at);
    const size_t own = what.output_at
                           ? std::max(in_front + what.input.size(), behind + what.capacity)
                           : what.input.size();
    block_ = std::make_unique<uint8_t[]>(own);
    other_ = std::make_unique<uint8_t[]>(what.output_at ? 0 : what.capacity);
    input = block_.get() + in_front;
    output = what.output_at ? block_.get() + behind : other_.get();
    std::fill_n(output, what.capacity, UNTOUCHED);
    std::ranges::copy(what.input, input);
  }

  uint8_t* input;
  uint8_t* output;

 private:
  std::unique_ptr<uint8_t[]> block_;
  std::unique_ptr<uint8_t[]> other_;
};

}  // namespace

byte_view reply::output() const {
  return ok() ? byte_view(buffer).first(std::min(output_size, buffer.size())) : byte_view();
}

testing::AssertionResult succeeded(const reply& answer) {
  return judge(answer.ok(), answer);
}

testing::AssertionResult refused(const reply& answer, int32_t km_error) {
  return judge(answer.res == TEEC_SUCCESS && answer.km_error == km_error, answer);
}

testing::AssertionResult failed_with(const reply& answer, TEEC_Result res) {
  return judge(answer.res == res, answer);
}

ta_under_test::ta_under_test(const options& wanted)
    : options_(wanted), path_(make_folder()), trace_(wanted.trace_level) {
  use_own_tas();
  tee::host::clear_fault();
  tee::host::set_clocks(START_SYSTEM_MS, START_REE_MS);
  tee::host::set_block_hook(inspect_freed, this);
  tee::device_settings settings;
  settings.identity = DEVICE_ID;
  settings.rpmb = wanted.rpmb;
  tee::device::create(path_, settings);
  tee::host::end_process_on_panic(true);  // a panic is a defect, and this finds its place
  EXPECT_EQ(start(), TEEC_SUCCESS) << trace_.errors();
}

ta_under_test::~ta_under_test() {
  stop();
  tee::host::set_block_hook(nullptr, nullptr);
  tee::host::use_real_clocks();
  tee::host::clear_fault();
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

reply ta_under_test::send(const request& what) {
  trace_.clear();
  const uint32_t types = what.types.value_or(default_types(what.id));
  const memory place(what);
  client::parameter_slots slots{};
  slots[0].value = {what.a, what.b};
  if (is_memory(types, 0)) slots[0].tmpref = {};
  if (is_memory(types, 1)) slots[1].tmpref = {place.input, what.input.size()};
  if (is_memory(types, 2)) slots[2].tmpref = {place.output, what.capacity};

  const live_counts before = counts();
  const client::status outcome = session_->invoke(what.id, types, &slots);
  reply answer{
      outcome.tee,         outcome.origin, 0, 0, bytes(place.output, place.output + what.capacity),
      slots[2].tmpref.size};
  if (!is_memory(types, 0)) {
    answer.km_error = static_cast<int32_t>(slots[0].value.a);
    answer.b = slots[0].value.b;
  }
  EXPECT_TRUE(what.output_at ||
              std::ranges::equal(what.input, byte_view(place.input, what.input.size())))
      << "command " << what.id << " wrote to its input";
  account(what, answer, before);
  return answer;
}

// Every command is told from what it left alive: a begin that is done adds an operation; update,
// finish and _abort with its handle change or end it; everything else leaves all as it was.
void ta_under_test::account(const request& what, const reply& answer, const live_counts& before) {
  const auto id = static_cast<command>(what.id);
  const auto live = live_.find(what.a);
  const bool on_live = (id == command::UPDATE || id == command::FINISH || id == command::ABORT) &&
                       live != live_.end() && !what.types && what.b == 0;
  const live_counts after = counts();
  if (answer.ok() && (id == command::BEGIN || (on_live && id == command::UPDATE))) {
    live_counts& held = live_[id == command::BEGIN ? answer.b : what.a];
    held = difference(after, difference(before, held));
    return;
  }
  if (std::exchange(loads_, false)) return;
  live_counts expected = before;
  if (on_live) {
    expected = difference(before, live->second);
    live_.erase(live);
  }
  EXPECT_EQ(text(after), text(expected))
      << "left by command " << what.id << ": " << trace_.errors();
}

void ta_under_test::fail_each_call(
    TEE_Result fault, const std::function<request()>& make,
    const std::function<void(const reply& answer, bool fired)>& check) {
  bool fired = true;
  for (uint64_t n = 1; fired; n++) {
    SCOPED_TRACE("platform call " + std::to_string(n));
    const request what = make();
    tee::host::fail_nth_call(n, fault);
    const reply answer = send(what);
    fired = tee::host::fault_fired();
    tee::host::clear_fault();
    check(answer, fired);
  }
}

live_counts ta_under_test::counts() const {
  live_counts counted;
  EXPECT_TRUE(tee::host::counts_of(KEYMASTER_TA, &counted)) << "no instance is alive";
  return counted;
}

void ta_under_test::inspect_freed(void* self, tee::host::block_stage stage, const uint8_t* block,
                                  size_t size) {
  if (stage != tee::host::block_stage::RELEASED) return;
  const byte_view freed(block, size);
  for (const bytes& secret : static_cast<ta_under_test*>(self)->secrets_) {
    EXPECT_EQ(std::search(freed.begin(), freed.end(), secret.begin(), secret.end()), freed.end())
        << "a block of " << size << " bytes was freed with a secret in it";
  }
}

void ta_under_test::stop() {
  session_.reset();
  context_.reset();
  live_.clear();
}

TEEC_Result ta_under_test::start() {
  trace_.clear();
  try {
    context_.emplace(path_);
    session_ = std::make_unique<client::connection>(*context_, client::KEYMASTER_UUID);
  } catch (const client::open_error& error) {
    stop();
    return error.reason().tee;
  }
  if (options_.configured) {
    EXPECT_TRUE(succeeded(configure(OS_VERSION, OS_PATCHLEVEL)));
  }
  return TEEC_SUCCESS;
}

void ta_under_test::restart() {
  stop();
  ASSERT_EQ(start(), TEEC_SUCCESS) << trace_.errors();
}

void ta_under_test::reboot() {
  stop();
  tee::device::reboot(path_);
  ASSERT_EQ(start(), TEEC_SUCCESS) << trace_.errors();
}

void ta_under_test::change_session() {
  auto other = std::make_unique<client::connection>(*context_, client::KEYMASTER_UUID);
  session_ = std::move(other);
}

bytes ta_under_test::token(const client::token_request& what) {
  return client::authenticator(*context_).issue(what).data;
}

}  // namespace keymaster::test
