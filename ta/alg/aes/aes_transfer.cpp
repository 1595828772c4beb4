// The way of an update's data from the client's memory through the cipher and back.
#include "ta/alg/aes/aes_transfer.h"

#include <algorithm>

namespace keymaster {
namespace {

constexpr size_t PIECE_SIZE = 4096;
// How many bytes the output can be ahead of the input that was fed: what earlier updates left here
// as a tag or block, or as an incomplete block in the cipher.
constexpr size_t HELD_BACK = std::max(AES_MAX_TAG_SIZE, AES_BLOCK_SIZE);

uintptr_t address(const uint8_t* place) {
  return reinterpret_cast<uintptr_t>(place);
}

bool share_memory(byte_view a, byte_view b) {
  return !a.empty() && !b.empty() && address(a.data()) < address(b.data()) + b.size() &&
         address(b.data()) < address(a.data()) + a.size();
}

}  // namespace

// Once a piece is fed, the output reaches as far behind its end as it starts behind the body's
// start, and at most what was held back further.
size_t aes_transfer::window_size() const {
  // An output that starts before the body wraps round.
  const size_t behind = address(step_->output.data()) - address(body_.data());
  const size_t ahead = behind < body_.size() ? behind : 0;
  return std::min(body_.size(), ahead + PIECE_SIZE + HELD_BACK);
}

void aes_transfer::read_ahead() {
  const size_t count = std::min(window_.size() - read_, body_.size());
  copy_bytes(window_.span().subspan(read_), body_.first(count));
  body_ = body_.subspan(count);
  read_ += count;
}

keymaster_error_t aes_transfer::start() {
  if (!share_memory(step_->output, step_->request)) return KM_ERROR_OK;
  if (!window_.allocate(window_size()) || !made_.allocate(PIECE_SIZE + AES_BLOCK_SIZE)) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  read_ahead();
  return KM_ERROR_OK;
}

bool aes_transfer::put(byte_view bytes) {
  const byte_span room = step_->output.subspan(step_->produced);
  if (room.size() < bytes.size()) return false;
  copy_bytes(room, bytes);
  step_->produced += bytes.size();
  return true;
}

TEE_Result aes_transfer::feed(byte_view bytes) {
  if (!made_) return aes_feed(operation_, bytes, step_->output, &step_->produced);
  const size_t room = std::min(made_.size(), step_->output.size() - step_->produced);
  size_t made = 0;
  TRY(aes_feed(operation_, bytes, made_.span().first(room), &made));
  return put(made_.view().first(made)) ? TEE_SUCCESS : TEE_ERROR_SHORT_BUFFER;
}

TEE_Result aes_transfer::feed_body() {
  if (!made_) return feed(body_);
  while (read_ > 0) {
    const size_t count = std::min(read_, PIECE_SIZE);
    TRY(feed(window_.view().first(count)));
    read_ -= count;
    copy_bytes(window_.span(), window_.view().subspan(count, read_));
    read_ahead();
  }
  return TEE_SUCCESS;
}

}  // namespace keymaster
