// What the device remembers of its storage outside the database.
#include "tee/device/replay_table.h"

#include <cerrno>
#include <utility>

#include "tee/device/table_bytes.h"

namespace tee {

namespace {

constexpr char TABLE_FILE[] = "replay";
constexpr char MAGIC[] = {'K', 'M', 'R', 'T'};
constexpr uint32_t FORM = 2;
constexpr size_t TABLE_FILE_LIMIT = 16 * 1024 * 1024;

void append_entry(std::vector<uint8_t>* out, const object_name& name, const replay_entry& entry) {
  append_number(out, name.storage);
  out->insert(out->end(), name.ta.begin(), name.ta.end());
  out->push_back(static_cast<uint8_t>(name.id.size()));
  out->insert(out->end(), name.id.begin(), name.id.end());
  append_number(out, entry.current);
  append_number(out, static_cast<uint8_t>(entry.next ? 1 : 0));
  append_number(out, entry.next.value_or(0));
}

std::optional<std::pair<object_name, replay_entry>> read_entry(table_reader* reader) {
  auto storage = reader->number<uint32_t>();
  if (!storage) return std::nullopt;
  auto name = reader->name(*storage);
  auto current = reader->number<uint64_t>();
  auto has_next = reader->number<uint8_t>();
  auto next = reader->number<uint64_t>();
  if (!name || !current || !has_next || !next) return std::nullopt;
  const replay_entry entry{*current, *has_next != 0 ? next : std::nullopt};
  return std::pair(std::move(*name), entry);
}

[[noreturn]] void throw_damaged(const device_folder& folder, const char* how) {
  throw device_error(device_error::kind::DAMAGED,
                     folder.path_of(TABLE_FILE) + ", the replay table, " + how);
}

}  // namespace

void replay_table::create(const device_folder& folder, const device_key& key) {
  store(folder, mac_key(key), {});
}

replay_table::replay_table(const device_folder& folder, const device_key& key)
    : folder_(folder), mac_key_(mac_key(key)) {
  auto file = folder.read(TABLE_FILE, TABLE_FILE_LIMIT);
  if (!file) throw_damaged(folder, "is missing");
  const std::span<const uint8_t> bytes = *file;
  if (bytes.size() < sizeof(mac_bytes)) throw_damaged(folder, "is not authentic");
  const auto body = bytes.first(bytes.size() - sizeof(mac_bytes));
  if (!same_mac(compute_mac(mac_key_, body), bytes.last(sizeof(mac_bytes)))) {
    throw_damaged(folder, "is not authentic");
  }
  parse(body);
}

replay_entry replay_table::entry_of(const object_name& name) const {
  auto found = content_.objects.find(name);
  return found == content_.objects.end() ? replay_entry{} : found->second;
}

uint64_t replay_table::prepare(const object_name& name, bool present) {
  content next = content_;
  next.counter++;
  const uint64_t generation = present ? next.counter : 0;
  next.objects[name].next = generation;
  replace(std::move(next));
  return generation;
}

void replay_table::settle(const object_name& name, uint64_t row_generation) {
  content next = content_;
  next.objects[name] = {row_generation, std::nullopt};
  if (row_generation == 0) next.objects.erase(name);
  replace(std::move(next));
}

void replay_table::replace(content next) {
  store(folder_, mac_key_, next);
  content_ = std::move(next);
}

void replay_table::store(const device_folder& folder, const device_key& mac_key,
                         const content& what) {
  std::vector<uint8_t> bytes(std::begin(MAGIC), std::end(MAGIC));
  append_number(&bytes, FORM);
  append_number(&bytes, what.counter);
  append_number(&bytes, static_cast<uint32_t>(what.objects.size()));
  for (const auto& [name, entry] : what.objects)
    append_entry(&bytes, name, entry);
  const mac_bytes mac = compute_mac(mac_key, bytes);
  bytes.insert(bytes.end(), mac.begin(), mac.end());
  if (bytes.size() > TABLE_FILE_LIMIT) {
    errno = ENOSPC;
    throw file_error("write", folder.path_of(TABLE_FILE));
  }
  folder.write(TABLE_FILE, bytes);
}

void replay_table::parse(std::span<const uint8_t> body) {
  table_reader reader(body);
  auto magic = reader.bytes(sizeof(MAGIC));
  auto form = reader.number<uint32_t>();
  auto counter = reader.number<uint64_t>();
  auto count = reader.number<uint32_t>();
  if (!magic || !std::equal(magic->begin(), magic->end(), MAGIC) || form != FORM || !count) {
    throw_damaged(folder_, "has an unknown form");
  }
  content_.counter = *counter;
  for (uint32_t i = 0; i < *count; i++) {
    auto next = read_entry(&reader);
    if (!next) throw_damaged(folder_, "is malformed");
    content_.objects.insert(std::move(*next));
  }
  if (!reader.done()) throw_damaged(folder_, "is malformed");
}

}  // namespace tee
