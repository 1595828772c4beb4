// Open persistent objects: shared content, sharing rules, rights and positions.
#include "tee/core/persistent_stream.h"

#include <algorithm>
#include <map>
#include <mutex>
#include <optional>
#include <utility>
#include <vector>

#include "tee/core/log.h"
#include "tee/device/object_store.h"

namespace tee {

// An object that is open somewhere in the process. Its content was authenticated when it was
// loaded; since then only this process can have changed it.
struct persistent_stream::shared {
  device& dev;
  object_name name;
  stored_object content;
  std::vector<uint32_t> holders;  // the flags of each handle
};

namespace {

using shared_key = std::pair<const device*, object_name>;

// Whether two handles to one object exclude each other.
bool conflict(uint32_t a, uint32_t b) {
  uint32_t either = a | b;
  uint32_t both = a & b;
  if ((either & TEE_DATA_FLAG_ACCESS_WRITE_META) != 0) return true;
  if ((a & SHARE_FLAGS) == 0 || (b & SHARE_FLAGS) == 0) return true;
  if (((a ^ b) & SHARE_FLAGS) != 0) return true;
  if ((either & TEE_DATA_FLAG_ACCESS_READ) != 0 && (both & TEE_DATA_FLAG_SHARE_READ) == 0) {
    return true;
  }
  return (either & TEE_DATA_FLAG_ACCESS_WRITE) != 0 && (both & TEE_DATA_FLAG_SHARE_WRITE) == 0;
}

bool conflict(const std::vector<uint32_t>& holders, uint32_t flags) {
  return std::any_of(holders.begin(), holders.end(),
                     [flags](uint32_t held) { return conflict(held, flags); });
}

// Runs a call of the object store; its failure is traced and becomes the result.
template <typename F>
TEE_Result use_store(F call) {
  try {
    call();
    return TEE_SUCCESS;
  } catch (const storage_error& error) {
    bool expected = error.result() == TEE_ERROR_ITEM_NOT_FOUND;
    log_line(expected ? TEE_TRACE_DEBUG : TEE_TRACE_ERROR, "%s", error.what());
    return error.result();
  }
}

TEE_Result load(device& dev, const object_name& name, std::optional<stored_object>* content) {
  TEE_Result res = use_store([&] {
    auto bytes = dev.objects().load(name);
    if (!bytes) return;
    *content = decode(*bytes);
    // Authentic, but not of this version.
    if (!*content) throw storage_error(TEE_ERROR_CORRUPT_OBJECT, "object store: unknown format");
  });
  // What an earlier failure left half done is undone first, and on a full disk that can fail.
  return res == TEE_ERROR_STORAGE_NO_SPACE ? TEE_ERROR_STORAGE_NOT_AVAILABLE : res;
}

TEE_Result save(device& dev, const object_name& name, const stored_object& content) {
  if (content.data.size() > STREAM_LIMIT) return TEE_ERROR_STORAGE_NO_SPACE;
  return use_store([&] { dev.objects().save(name, encode(content)); });
}

}  // namespace

// All open objects of the process. One mutex guards them, their content included: what takes long
// is the store, which is one call at a time anyway.
struct persistent_stream::shared_objects {
  std::mutex mutex;
  std::map<shared_key, std::shared_ptr<shared>> objects;

  static shared_objects& all() {
    static auto& instance = *new shared_objects;  // outlives all that may still be open at exit
    return instance;
  }

  std::shared_ptr<shared> find(const device& dev, const object_name& name) {
    auto found = objects.find({&dev, name});
    return found == objects.end() ? nullptr : found->second;
  }

  // A handle with `flags` on the object, which is open from now on if it was not before.
  std::shared_ptr<persistent_stream> attach(std::shared_ptr<shared> object, uint32_t flags) {
    flags &= ACCESS_FLAGS | SHARE_FLAGS;
    objects.try_emplace({&object->dev, object->name}, object);
    return std::make_shared<persistent_stream>(std::move(object), flags);
  }
};

TEE_Result persistent_stream::open(device& dev, const object_name& name, uint32_t flags,
                                   std::shared_ptr<persistent_stream>* stream) {
  shared_objects& all = shared_objects::all();
  std::lock_guard lock(all.mutex);
  std::shared_ptr<shared> object = all.find(dev, name);
  if (object && conflict(object->holders, flags)) return TEE_ERROR_ACCESS_CONFLICT;
  if (!object) {
    std::optional<stored_object> content;
    if (TEE_Result res = load(dev, name, &content)) return res;
    if (!content) return TEE_ERROR_ITEM_NOT_FOUND;
    object = std::make_shared<shared>(shared{dev, name, std::move(*content), {}});
  }
  *stream = all.attach(std::move(object), flags);
  return TEE_SUCCESS;
}

TEE_Result persistent_stream::create(device& dev, const object_name& name, uint32_t flags,
                                     stored_object content,
                                     std::shared_ptr<persistent_stream>* stream) {
  shared_objects& all = shared_objects::all();
  std::lock_guard lock(all.mutex);
  std::shared_ptr<shared> object = all.find(dev, name);
  if ((flags & TEE_DATA_FLAG_OVERWRITE) == 0) {
    std::optional<stored_object> old;
    if (object) return TEE_ERROR_ACCESS_CONFLICT;
    if (TEE_Result res = load(dev, name, &old)) return res;
    if (old) return TEE_ERROR_ACCESS_CONFLICT;
  }
  if (object && conflict(object->holders, flags)) return TEE_ERROR_ACCESS_CONFLICT;
  if (!object) object = std::make_shared<shared>(shared{dev, name, {}, {}});
  if (TEE_Result res = save(dev, name, content)) return res;
  object->content = std::move(content);
  *stream = all.attach(std::move(object), flags);
  return TEE_SUCCESS;
}

persistent_stream::persistent_stream(std::shared_ptr<shared> object, uint32_t flags)
    : object_(std::move(object)), flags_(flags) {
  object_->holders.push_back(flags);
}

persistent_stream::~persistent_stream() {
  shared_objects& all = shared_objects::all();
  std::lock_guard lock(all.mutex);
  auto& holders = object_->holders;
  holders.erase(std::find(holders.begin(), holders.end(), flags_));
  if (holders.empty()) all.objects.erase({&object_->dev, object_->name});
}

size_t persistent_stream::size() const {
  std::lock_guard lock(shared_objects::all().mutex);
  return object_->content.data.size();
}

const stored_object& persistent_stream::attributes() const {
  return object_->content;
}

size_t persistent_stream::read(std::span<uint8_t> out) {
  std::lock_guard lock(shared_objects::all().mutex);
  const secret_bytes& data = object_->content.data;
  if (position_ >= data.size()) return 0;
  size_t count = std::min(out.size(), data.size() - position_);
  std::copy_n(data.begin() + static_cast<ptrdiff_t>(position_), count, out.begin());
  position_ += count;
  return count;
}

TEE_Result persistent_stream::write(std::span<const uint8_t> bytes) {
  if (bytes.size() > TEE_DATA_MAX_POSITION - position_) return TEE_ERROR_OVERFLOW;
  if (bytes.empty()) return TEE_SUCCESS;
  size_t end = position_ + bytes.size();
  if (end > STREAM_LIMIT) return TEE_ERROR_STORAGE_NO_SPACE;
  std::lock_guard lock(shared_objects::all().mutex);
  stored_object next = object_->content;
  next.data.resize(std::max(end, next.data.size()));
  std::copy(bytes.begin(), bytes.end(), next.data.begin() + static_cast<ptrdiff_t>(position_));
  if (TEE_Result res = save(object_->dev, object_->name, next)) return res;
  object_->content = std::move(next);
  position_ = end;
  return TEE_SUCCESS;
}

TEE_Result persistent_stream::seek(intmax_t offset, TEE_Whence whence) {
  size_t base = 0;
  if (whence == TEE_DATA_SEEK_CUR) base = position_;
  if (whence == TEE_DATA_SEEK_END) base = size();
  if (offset < -static_cast<intmax_t>(base)) {
    position_ = 0;
    return TEE_SUCCESS;
  }
  if (offset > static_cast<intmax_t>(TEE_DATA_MAX_POSITION - base)) return TEE_ERROR_OVERFLOW;
  position_ = static_cast<size_t>(static_cast<intmax_t>(base) + offset);
  return TEE_SUCCESS;
}

TEE_Result persistent_stream::remove() {
  std::lock_guard lock(shared_objects::all().mutex);
  return use_store([&] { object_->dev.objects().remove(object_->name); });
}

}  // namespace tee
