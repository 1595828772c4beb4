// What the device remembers of its replay-protected storage outside the database.
#include "tee/device/replay_table.h"

#include "tee_extensions.h"

#include <algorithm>
#include <cerrno>
#include <utility>

#include "tee/device/files.h"

namespace tee {

namespace {

constexpr char MAGIC[] = {'K', 'M', 'R', 'T'};
constexpr uint32_t VERSION = 1;
constexpr size_t TABLE_FILE_LIMIT = 16 * 1024 * 1024;

using entry = std::pair<object_name, uint64_t>;

template <typename T>
void append(std::vector<uint8_t>* out, T value) {
  for (size_t i = 0; i < sizeof(T); i++)
    out->push_back(static_cast<uint8_t>(value >> (8 * i)));
}

void append_entry(std::vector<uint8_t>* out, const object_name& name, uint64_t generation) {
  out->insert(out->end(), name.ta.begin(), name.ta.end());
  out->push_back(static_cast<uint8_t>(name.id.size()));
  out->insert(out->end(), name.id.begin(), name.id.end());
  append(out, generation);
}

// Reads what append wrote; a failed read gives nothing and reads no further.
class table_reader {
 public:
  explicit table_reader(std::span<const uint8_t> bytes) : rest_(bytes) {}

  std::optional<std::span<const uint8_t>> bytes(size_t length) {
    if (length > rest_.size()) return std::nullopt;
    return take(length);
  }

  template <typename T>
  std::optional<T> number() {
    if (sizeof(T) > rest_.size()) return std::nullopt;
    T value = 0;
    size_t shift = 0;
    for (uint8_t byte : take(sizeof(T))) {
      value = static_cast<T>(value | static_cast<T>(byte) << shift);
      shift += 8;
    }
    return value;
  }

  std::optional<entry> next_entry() {
    auto ta = bytes(sizeof(uuid_bytes));
    auto length = number<uint8_t>();
    if (!ta || !length || *length > TEE_OBJECT_ID_MAX_LEN) return std::nullopt;
    auto id = bytes(*length);
    auto generation = number<uint64_t>();
    if (!id || !generation) return std::nullopt;
    object_name name{TEE_STORAGE_RPMB, {}, {id->begin(), id->end()}};
    std::copy(ta->begin(), ta->end(), name.ta.begin());
    return entry{std::move(name), *generation};
  }

  bool done() const { return rest_.empty(); }

 private:
  std::span<const uint8_t> take(size_t length) {
    auto taken = rest_.first(length);
    rest_ = rest_.subspan(length);
    return taken;
  }

  std::span<const uint8_t> rest_;
};

[[noreturn]] void throw_damaged(const std::string& path) {
  throw device_error(device_error::kind::DAMAGED, path + " is not authentic");
}

}  // namespace

replay_table::replay_table(std::string path, device_key key)
    : path_(std::move(path)), key_(std::move(key)) {
  read();
}

void replay_table::make() {
  if (!made_) store({});
}

uint64_t replay_table::generation_of(const object_name& name) const {
  auto found = content_.generations.find(name);
  return found == content_.generations.end() ? 0 : found->second;
}

uint64_t replay_table::prepare(const object_name& name, bool present) {
  content next = content_;
  next.counter++;
  next.pending = entry{name, present ? next.counter : 0};
  store(std::move(next));
  return content_.pending->second;
}

const object_name* replay_table::pending() const {
  return content_.pending ? &content_.pending->first : nullptr;
}

void replay_table::settle(uint64_t row_generation) {
  content next = content_;
  auto [name, generation] = *std::exchange(next.pending, std::nullopt);
  if (row_generation == generation) {
    next.generations.erase(name);
    if (generation != 0) next.generations.emplace(name, generation);
  }
  store(std::move(next));
}

void replay_table::store(content next) {
  std::vector<uint8_t> bytes(std::begin(MAGIC), std::end(MAGIC));
  append(&bytes, VERSION);
  append(&bytes, next.counter);
  append(&bytes, static_cast<uint32_t>(next.generations.size()));
  for (const auto& [name, generation] : next.generations)
    append_entry(&bytes, name, generation);
  append(&bytes, static_cast<uint32_t>(next.pending ? 1 : 0));
  if (next.pending) append_entry(&bytes, next.pending->first, next.pending->second);
  mac_bytes mac = compute_mac(key_, bytes);
  bytes.insert(bytes.end(), mac.begin(), mac.end());
  if (bytes.size() > TABLE_FILE_LIMIT) {
    errno = ENOSPC;
    throw file_error("write", path_);
  }
  write_file(path_, bytes);
  content_ = std::move(next);
  made_ = true;
}

void replay_table::read() {
  auto file = read_file(path_, TABLE_FILE_LIMIT);
  if (!file) return;
  std::span<const uint8_t> bytes = *file;
  if (bytes.size() < sizeof(mac_bytes)) throw_damaged(path_);
  auto body = bytes.first(bytes.size() - sizeof(mac_bytes));
  if (!same_mac(compute_mac(key_, body), bytes.last(sizeof(mac_bytes)))) throw_damaged(path_);

  table_reader reader(body);
  auto magic = reader.bytes(sizeof(MAGIC));
  auto version = reader.number<uint32_t>();
  auto counter = reader.number<uint64_t>();
  auto count = reader.number<uint32_t>();
  if (!magic || !std::equal(magic->begin(), magic->end(), MAGIC) || version != VERSION || !count) {
    throw_damaged(path_);
  }
  content_.counter = *counter;
  for (uint32_t i = 0; i < *count; i++) {
    auto next = reader.next_entry();
    if (!next) throw_damaged(path_);
    content_.generations.insert(std::move(*next));
  }
  auto pending = reader.number<uint32_t>();
  if (pending == 1u) content_.pending = reader.next_entry();
  if (!pending || *pending > 1 || (*pending == 1) != content_.pending.has_value() ||
      !reader.done()) {
    throw_damaged(path_);
  }
  made_ = true;
}

}  // namespace tee
