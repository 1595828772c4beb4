// The boot of a device. boot.json: "boot_seed" (64 hexadecimal digits), "machine_boot_id" (the
// kernel's, which tells one start of the machine from another), "boot_ms".
#include "tee/device/boot.h"

#include <algorithm>
#include <charconv>
#include <optional>
#include <string_view>

#include "tee/device/clock.h"
#include "tee/device/files.h"
#include "tee/device/json_file.h"
#include "tee/device/sealing.h"

namespace tee {

namespace {

constexpr char BOOT_FILE[] = "boot.json";
constexpr size_t BOOT_FILE_LIMIT = 4096;
constexpr std::string_view SEED_KEY = "\"boot_seed\"";
constexpr size_t SEED_DIGITS = 2 * device::BOOT_SEED_LENGTH;
constexpr char BLANK = '0';

std::string machine_boot_id() {
  auto text = read_file("/proc/sys/kernel/random/boot_id", 64);
  if (!text) return {};
  while (!text->empty() && text->back() == '\n')
    text->pop_back();
  return {text->begin(), text->end()};
}

std::string_view text_of(const secret_bytes& bytes) {
  return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

// Where the seed's digits stand in the text of boot.json, if it has such a place. They are handled
// here and not by the JSON library, which would leave copies of them in memory that is not wiped.
std::optional<size_t> seed_place(std::string_view text) {
  size_t key = text.find(SEED_KEY);
  if (key == std::string_view::npos) return std::nullopt;
  size_t colon = text.find_first_not_of(" \t\r\n", key + SEED_KEY.size());
  if (colon == std::string_view::npos || text[colon] != ':') return std::nullopt;
  size_t quote = text.find_first_not_of(" \t\r\n", colon + 1);
  if (quote == std::string_view::npos || text[quote] != '"') return std::nullopt;
  size_t end = quote + 1 + SEED_DIGITS;
  if (end >= text.size() || text[end] != '"') return std::nullopt;
  return quote + 1;
}

// Moves the seed out of the text, leaving blanks; nothing when what stands there is not one.
std::optional<secret_bytes> take_seed(secret_bytes* text) {
  auto place = seed_place(text_of(*text));
  if (!place) return std::nullopt;
  const char* digits = text_of(*text).data() + *place;
  secret_bytes seed(device::BOOT_SEED_LENGTH);
  for (size_t i = 0; i < seed.size(); i++) {
    const char* end = digits + 2 * i + 2;
    if (std::from_chars(end - 2, end, seed[i], 16).ptr != end) return std::nullopt;
  }
  std::fill_n(text->begin() + static_cast<ptrdiff_t>(*place), SEED_DIGITS, BLANK);
  return seed;
}

void put_seed(const secret_bytes& seed, secret_bytes* text) {
  auto digit = text->begin() + static_cast<ptrdiff_t>(*seed_place(text_of(*text)));
  for (uint8_t byte : seed) {
    *digit++ = static_cast<uint8_t>("0123456789abcdef"[byte >> 4]);
    *digit++ = static_cast<uint8_t>("0123456789abcdef"[byte & 0xF]);
  }
}

}  // namespace

boot_record start_boot(const device_folder& folder) {
  boot_record boot{secret_bytes(device::BOOT_SEED_LENGTH), machine_clock_ms()};
  fill_random(boot.seed);
  json document = {{"boot_seed", std::string(SEED_DIGITS, BLANK)},
                   {"machine_boot_id", machine_boot_id()},
                   {"boot_ms", boot.boot_ms}};
  std::string blank = to_file_text(document);
  secret_bytes text(blank.begin(), blank.end());
  put_seed(boot.seed, &text);
  folder.write(BOOT_FILE, text);
  return boot;
}

boot_record current_boot(const device_folder& folder) {
  const std::string path = folder.path_of(BOOT_FILE);
  auto text = folder.read(BOOT_FILE, BOOT_FILE_LIMIT);
  if (!text) throw device_error(device_error::kind::DAMAGED, path + " is missing");
  auto seed = take_seed(&*text);
  if (!seed) throw device_error(device_error::kind::DAMAGED, path + " holds no boot seed");
  json document = parse_json(text_of(*text), path);
  auto boot_ms = json_number(document, "boot_ms", UINT64_MAX, path);
  auto boot_id = json_text(document, "machine_boot_id", path);
  // A clock behind the boot is another machine start even if the kernel does not say so.
  if (boot_id != machine_boot_id() || machine_clock_ms() < boot_ms) return start_boot(folder);
  return {std::move(*seed), boot_ms};
}

}  // namespace tee
