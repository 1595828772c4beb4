// The SOTER counter: it lives through restarts and kills, never repeats, never goes back.
#include <csignal>
#include <sys/wait.h>
#include <unistd.h>

#include "ta/soter_device.h"
#include "tee/core/stored_object.h"
#include "tee/device/object_store.h"

namespace keymaster::test {
namespace {

const tee::object_name COUNTER_OBJECT = {TEE_STORAGE_PRIVATE,
                                         tee::to_bytes(KEYMASTER_TA),
                                         {'S', 'O', 'T', 'E', 'R', '_', 'C', 'O', 'U', 'N', 'T',
                                          'E', 'R', '_', 'O', 'B', 'J', 'E', 'C', 'T', 0}};

class Counter : public soter_device {
 protected:
  Counter()
      : blob(ta.import(soter_key(one(KM_TAG_SOTER_ATTK_SIGNS, 1).add_flag(KM_TAG_SOTER_COUNTER)),
                       pkey::rsa(1024).import_data())) {}

  // Of the next document; 0 when there is none.
  uint64_t next() {
    ta.expect_loading();
    const reply answer = ta.send_well(key_request(command::EXPORT_KEY, blob));
    if (answer.output_size == 0) return 0;
    const std::string text(client::parse_signed_document(answer.output()).text());
    EXPECT_TRUE(text.starts_with(R"({"counter":)"));
    return std::stoull(text.substr(11));
  }
  // What the stored object holds; the device must be stopped.
  bytes stored() {
    const auto found = tee::device::open(ta.path())->objects().load(COUNTER_OBJECT);
    return client::copy_of(tee::decode(found.value())->data);
  }
  void store(const bytes& content) {
    tee::stored_object object;
    object.data.assign(content.begin(), content.end());
    tee::device::open(ta.path())->objects().save(COUNTER_OBJECT, tee::encode(object));
  }

  bytes blob;
};

TEST_F(Counter, OutlivesInstancesAndBoots) {
  EXPECT_EQ(next(), 1u);
  EXPECT_EQ(next(), 2u);
  ta.restart();
  EXPECT_EQ(next(), 3u);
  ta.reboot();
  EXPECT_EQ(next(), 4u);
  ta.stop();
  EXPECT_EQ(stored(), (bytes{4, 0, 0, 0, 0, 0, 0, 0}));
  store({0xFF, 0xFF, 0xFF, 0xFF, 0, 0, 0, 0});  // the word above takes part
  ta.restart();
  EXPECT_EQ(next(), uint64_t{1} << 32);
}

TEST_F(Counter, OfAnotherSizeIsNeverRepaired) {
  for (const size_t size : {0, 4, 7, 9, 16}) {
    ta.stop();
    const bytes wrong(size, 7);
    store(wrong);
    ta.restart();
    for (int attempt = 0; attempt < 2; attempt++) {
      EXPECT_EQ(next(), 0u) << size;
      EXPECT_TRUE(ta.trace().has("increase_and_get_counter: counter object is not 8 bytes, " +
                                 std::to_string(std::min<size_t>(size, 9)) + " bytes"));
    }
    ta.stop();
    EXPECT_EQ(stored(), wrong);
  }
}

// Whoever has seen a counter never sees it again, wherever the one who raised it was killed.
TEST_F(Counter, OutlivesKills) {
  uint64_t last = 0;
  for (int round = 0; round < 20; round++) {
    ta.stop();
    int seen[2];
    ASSERT_EQ(pipe(seen), 0);
    const pid_t child = fork();
    if (child == 0) {
      if (ta.start() != TEEC_SUCCESS) _exit(1);
      for (;;) {
        const uint64_t counter = next();
        if (write(seen[1], &counter, sizeof(counter)) != sizeof(counter)) _exit(1);
      }
    }
    close(seen[1]);
    uint64_t counter = 0;
    ASSERT_EQ(read(seen[0], &counter, sizeof(counter)), ssize_t{sizeof(counter)});
    usleep(static_cast<useconds_t>(1000 + 370 * round));
    kill(child, SIGKILL);
    waitpid(child, nullptr, 0);
    do {
      EXPECT_GT(counter, last);
      last = counter;
    } while (read(seen[0], &counter, sizeof(counter)) == ssize_t{sizeof(counter)});
    close(seen[0]);
    ta.restart();
    const uint64_t after = next();
    EXPECT_GT(after, last);
    last = after;
  }
}

}  // namespace
}  // namespace keymaster::test
