// Counted and rate-limited keys, their log, and the operation pool.
#include <ctime>
#include <set>

#include "ta/auth.h"

namespace keymaster::test {
namespace {

using use_limits = auth;

constexpr char TOO_SOON[] = "authorize_begin: key rate limit exceeded";
constexpr char USED_UP[] = "check_use_count_and_add: Key max ops exceeded";

TEST_F(use_limits, rate_limit_counts_whole_seconds_and_includes_the_limit) {
  // A record whose time is over goes to the next key, and nothing of it remains.
  expect_sign(ta.generate(signer(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 0)));
  ta.advance(1'000);
  // A limit beyond the device's uptime: a record that only counts uses is no use at time 0.
  const bytes key =
      ta.generate(signer(KM_TAG_MAX_USES_PER_BOOT, 9).add(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 10'000));
  expect_sign(key);
  ta.advance(10'000'749);  // begun a quarter into a second: the last millisecond of the limit's
  expect_sign(key, -54, TOO_SOON);
  ta.advance(1);
  expect_sign(key);
  expect_sign(key, -54, TOO_SOON);
  // A begin whose authentication is due is a use.
  const bytes due = ta.generate(user_key(1).add(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 1));
  expect_sign(due);
  expect_sign(due, -54, TOO_SOON);
}

TEST_F(use_limits, every_rate_limit_of_a_key_counts_and_the_largest_is_recorded) {
  const bytes key = ta.generate(sign_key(several(KM_TAG_MIN_SECONDS_BETWEEN_OPS, {3, 20, 5})));
  expect_sign(key);
  ta.advance(20'000);
  expect_sign(key, -54, TOO_SOON);
  // Seven more records fill the log: the first is not given away before its largest limit is over.
  for (int i = 0; i < 7; i++)
    expect_sign(ta.generate(signer(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 60)));
  const bytes ninth = ta.generate(signer(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 60));
  expect_sign(ninth);
  expect_sign(ninth);
  ta.advance(1'000);
  expect_sign(ninth);
  expect_sign(ninth, -54, TOO_SOON);
}

// A key with very many users: were the set searched for each of them, this would take minutes.
TEST_F(use_limits, begin_takes_time_in_proportion_to_the_key_s_parameters) {
  param_set users = user_key(1);
  for (uint64_t i = 0; i < 15'000; i++)
    users.add(KM_TAG_USER_SECURE_ID, i);
  const reply key = ta.send_well(generate_request(users, 1 << 20));
  const std::clock_t before = std::clock();
  expect_sign(key.output());
  EXPECT_LT(std::clock() - before, CLOCKS_PER_SEC / 2);
}

TEST_F(use_limits, full_log_lets_a_rate_limited_key_pass_until_a_record_is_over) {
  // The longest limits end after the clock does: their records are never over.
  for (const uint32_t seconds : {UINT32_MAX, UINT32_MAX, 10u, 60u, 60u, 60u, 60u, 60u}) {
    expect_sign(ta.generate(signer(KM_TAG_MIN_SECONDS_BETWEEN_OPS, seconds)));
  }
  const bytes ninth = ta.generate(signer(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 20));
  const bytes tenth = ta.generate(signer(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 20));
  expect_sign(ninth);
  ta.advance(10'000);
  expect_sign(ninth);
  ta.advance(1'000);
  expect_sign(ninth);
  expect_sign(ninth, -54, TOO_SOON);
  expect_sign(tenth);
  expect_sign(tenth);
}

TEST_F(use_limits, uses_are_counted_even_when_the_begin_is_refused_later) {
  for (const uint32_t maximum : {0, 1, 2}) {
    SCOPED_TRACE(maximum);
    const bytes key = ta.generate(signer(KM_TAG_MAX_USES_PER_BOOT, maximum));
    expect_begin(SIGN, key, one(KM_TAG_DIGEST, KM_DIGEST_SHA1), -13,
                 "authorize_begin: No such digest in key_params");
    if (maximum == 2) expect_sign(key);
    expect_sign(key, -56, USED_UP);
  }
}

TEST_F(use_limits, ninth_counted_key_is_refused_until_the_instance_ends) {
  bytes key;
  for (int i = 0; i < 8; i++) {
    key = ta.generate(signer(KM_TAG_MAX_USES_PER_BOOT, 2));
    expect_sign(key);
  }
  const bytes ninth = ta.generate(signer(KM_TAG_MAX_USES_PER_BOOT, 2));
  ta.advance(86'400'000);
  expect_sign(ninth, -31, "check_use_count_and_add: Too many use log");
  expect_sign(key);  // it has a record
  ta.restart();
  expect_sign(ninth);
}

TEST_F(use_limits, keys_are_told_apart_also_when_their_blobs_are_longer_than_the_log_s_field) {
  const param_set app = bound_to(std::string(3000, 'a'));
  const param_set description = signer(KM_TAG_MAX_USES_PER_BOOT, 1).append(app);
  for (const bytes& key : {ta.generate(description), ta.generate(description)}) {
    expect_sign(key, 0, "", app);
    expect_sign(key, -56, USED_UP, app);
  }
}

TEST_F(use_limits, pool_holds_sixteen_operations_of_all_sessions) {
  const bytes key = ta.generate(sign_key());
  std::set<uint32_t> handles;
  for (int i = 0; i < 16; i++) {
    if (i == 8) ta.change_session();
    handles.insert(ta.begun(SIGN, key, sign_request()));
  }
  EXPECT_EQ(handles.size(), 16u);
  EXPECT_FALSE(handles.contains(0));
  expect_sign(key, -31,
              "operation_pool_add: Too many operations | begin: Allocate in operation pool failed");
  EXPECT_TRUE(succeeded(ta.abort(*handles.begin())));
  EXPECT_TRUE(refused(ta.abort(*handles.begin()), -28));
  EXPECT_EQ(ta.trace().errors(), "operation_pool_get: Operation handle not found");
  EXPECT_TRUE(refused(ta.update(0, bytes(1)), -28));  // what a slot that was never used remembers
  expect_sign(key);
  EXPECT_TRUE(succeeded(ta.update(*handles.rbegin(), bytes(1))));
}

}  // namespace
}  // namespace keymaster::test
