// Random bytes. A request costs libcrypto most of a microsecond however short it is, and most are
// for a nonce or a handle, so short ones are served from bytes that were drawn ahead.
#include "tee/crypto/random.h"

#include <algorithm>
#include <array>
#include <mutex>
#include <openssl/crypto.h>
#include <openssl/rand.h>
#include <pthread.h>

#include "tee/crypto/openssl.h"

namespace tee::crypto {
namespace {

void draw(std::span<uint8_t> bytes) {
  must(RAND_priv_bytes_ex(nullptr, bytes.data(), bytes.size(), 0) == 1, "RAND_priv_bytes_ex");
}

// Bytes that nobody has seen yet. What is handed out is wiped here at once.
class random_pool {
 public:
  static constexpr size_t LONGEST = 128;  // requests above gain nothing

  void take(std::span<uint8_t> to) {
    if (left_ < to.size()) refill();
    left_ -= to.size();
    std::span<uint8_t> taken = std::span(bytes_).subspan(left_, to.size());
    std::copy(taken.begin(), taken.end(), to.begin());
    OPENSSL_cleanse(taken.data(), taken.size());
  }

  void clear() {
    OPENSSL_cleanse(bytes_.data(), bytes_.size());
    left_ = 0;
  }

 private:
  void refill() {
    left_ = 0;  // also when drawing fails half-way
    draw(bytes_);
    left_ = bytes_.size();
  }

  std::array<uint8_t, 512> bytes_{};
  size_t left_ = 0;
};

// The pool of the process. Never destroyed: trusted applications may run as late as they like. The
// child of a fork must not hand out what its parent does, so it begins with an empty pool; holding
// the lock across the fork keeps both in order whatever other threads are at.
struct shared_pool {
  std::mutex mutex;
  random_pool pool;

  shared_pool() { must(pthread_atfork(lock, unlock, clear) == 0, "pthread_atfork"); }

  static shared_pool& get() {
    static shared_pool& only = *new shared_pool;
    return only;
  }

 private:
  static void lock() { get().mutex.lock(); }
  static void unlock() { get().mutex.unlock(); }
  static void clear() {
    get().pool.clear();
    get().mutex.unlock();
  }
};

}  // namespace

void fill_random(std::span<uint8_t> bytes) {
  if (bytes.size() > random_pool::LONGEST) return draw(bytes);
  shared_pool& shared = shared_pool::get();
  std::lock_guard lock(shared.mutex);
  shared.pool.take(bytes);
}

}  // namespace tee::crypto
