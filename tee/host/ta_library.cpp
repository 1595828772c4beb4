// A trusted application's shared object: found, loaded, its entry points looked up.
#include "tee/host/ta_library.h"

#include <charconv>
#include <cstdlib>
#include <dlfcn.h>
#include <string_view>
#include <sys/mman.h>
#include <sys/sendfile.h>
#include <sys/stat.h>
#include <vector>

#include "tee/core/log.h"
#include "tee/device/os_open.h"
#include "tee/device/uuid.h"

namespace tee {

namespace {

constexpr size_t COPY_AT_ONCE = 1024 * 1024;

// Calls visit for every part of `text` between separators.
template <typename Visit>
void split(std::string_view text, char separator, Visit visit) {
  while (!text.empty()) {
    size_t end = std::min(text.find(separator), text.size());
    visit(text.substr(0, end));
    text.remove_prefix(std::min(end + 1, text.size()));
  }
}

// The folder in which this library lies.
std::string library_folder() {
  Dl_info info{};
  if (dladdr(reinterpret_cast<void*>(&library_folder), &info) == 0) return ".";
  std::string path = info.dli_fname;
  size_t slash = path.rfind('/');
  return slash == std::string::npos ? "." : path.substr(0, slash);
}

std::vector<std::string> search_folders() {
  std::vector<std::string> folders;
  // A program with raised rights does not load what its caller's environment names.
  if (const char* path = secure_getenv("TEE_TA_PATH"); path != nullptr && *path != '\0') {
    split(path, ':', [&](std::string_view folder) {
      if (!folder.empty()) folders.emplace_back(folder);
    });
    return folders;
  }
  const std::string own = library_folder();
  return {own + "/tee", own + "/../ta"};
}

std::string find_file(const std::string& name) {
  for (const std::string& folder : search_folders()) {
    std::string path = folder + "/" + name;
    struct stat status {};
    if (stat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode)) return path;
  }
  return {};
}

bool is_resident(const std::string& name) {
  void* handle = dlopen(name.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NOLOAD);
  if (handle == nullptr) return false;
  dlclose(handle);
  return true;
}

bool copy_file(const std::string& path, int target) {
  file_descriptor source(os::open_file(path.c_str(), os::open_mode::READ));
  if (!source) return false;
  ssize_t copied = 0;
  do {
    copied = sendfile(target, source.get(), nullptr, COPY_AT_ONCE);
  } while (copied > 0);
  return copied == 0;
}

property_value to_value(std::string_view text) {
  if (text == "true" || text == "false") return text == "true";
  uint32_t number = 0;
  const char* end = text.data() + text.size();
  auto [stop, error] = std::from_chars(text.data(), end, number);
  if (error == std::errc() && stop == end) return number;
  return std::string(text);
}

template <typename F>
bool look_up(void* handle, const char* name, F* entry) {
  *entry = reinterpret_cast<F>(dlsym(handle, name));
  if (*entry == nullptr) log_line(TEE_TRACE_ERROR, "no %s in the trusted application", name);
  return *entry != nullptr;
}

}  // namespace

TEE_Result ta_library::load(const TEE_UUID& uuid, std::unique_ptr<ta_library>* library) {
  const std::string name = to_text(uuid) + ".ta";
  const std::string path = find_file(name);
  if (path.empty()) {
    log_line(TEE_TRACE_INFO, "there is no %s", name.c_str());
    return TEE_ERROR_ITEM_NOT_FOUND;
  }
  std::unique_ptr<ta_library> loaded(new ta_library);
  // The linker would give the same copy, with its globals as they are, to a second instance (of
  // another device, say), and may have kept it from an earlier one.
  TEE_Result res = is_resident(path) ? loaded->open_private_copy(path) : loaded->open(path);
  if (res != TEE_SUCCESS) return res;
  if (!loaded->find_entries(path)) return TEE_ERROR_BAD_FORMAT;
  *library = std::move(loaded);
  return TEE_SUCCESS;
}

TEE_Result ta_library::open(const std::string& path) {
  handle_ = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
  loaded_name_ = path;
  if (handle_ != nullptr) return TEE_SUCCESS;
  log_line(TEE_TRACE_ERROR, "cannot load a trusted application: %s", dlerror());
  return TEE_ERROR_BAD_FORMAT;
}

TEE_Result ta_library::open_private_copy(const std::string& path) {
  copy_ = file_descriptor(memfd_create("ta", MFD_CLOEXEC));
  if (!copy_ || !copy_file(path, copy_.get())) {
    log_line(TEE_TRACE_ERROR, "cannot copy %s", path.c_str());
    return TEE_ERROR_BAD_FORMAT;
  }
  return open("/proc/self/fd/" + std::to_string(copy_.get()));
}

bool ta_library::find_entries(const std::string& path) {
  bool complete = look_up(handle_, "TA_CreateEntryPoint", &entries_.create) &&
                  look_up(handle_, "TA_DestroyEntryPoint", &entries_.destroy) &&
                  look_up(handle_, "TA_OpenSessionEntryPoint", &entries_.open_session) &&
                  look_up(handle_, "TA_CloseSessionEntryPoint", &entries_.close_session) &&
                  look_up(handle_, "TA_InvokeCommandEntryPoint", &entries_.invoke_command);
  if (!complete) log_line(TEE_TRACE_ERROR, "%s is no trusted application", path.c_str());
  return complete;
}

property_map ta_library::properties() const {
  property_map properties;
  const auto* text = static_cast<const char*>(dlsym(handle_, "TA_Properties"));
  if (text == nullptr) return properties;
  split(text, '\n', [&](std::string_view line) {
    size_t equals = line.find('=');
    if (equals == std::string_view::npos || equals == 0) return;
    properties.insert_or_assign(std::string(line.substr(0, equals)),
                                to_value(line.substr(equals + 1)));
  });
  return properties;
}

ta_library::~ta_library() {
  if (handle_ == nullptr) return;
  dlclose(handle_);
  // A copy that the linker keeps would be found again under the name of a later copy, were its
  // descriptor number free; so that stays taken.
  if (copy_ && is_resident(loaded_name_)) copy_.release();
}

}  // namespace tee
