// A trusted application's shared object, <uuid>.ta: found, loaded, its entry points looked up.
#pragma once

#include "tee_internal_api.h"

#include <memory>
#include <string>

#include "tee/core/properties.h"
#include "tee/device/files.h"

namespace tee {

// The five functions that a trusted application exports.
struct ta_entry_points {
  decltype(&TA_CreateEntryPoint) create;
  decltype(&TA_DestroyEntryPoint) destroy;
  decltype(&TA_OpenSessionEntryPoint) open_session;
  decltype(&TA_CloseSessionEntryPoint) close_session;
  decltype(&TA_InvokeCommandEntryPoint) invoke_command;
};

// One loaded copy, whose globals are those of a program that has just started and belong to it
// alone.
//
// A file is looked for in the folders of $TEE_TA_PATH (separated by colons) when that is set, else
// beside this library: in tee/ of an installation, in ../ta/ of the build tree.
class ta_library {
 public:
  // load: TEE_ERROR_ITEM_NOT_FOUND when there is no file for `uuid`, TEE_ERROR_BAD_FORMAT when it
  // cannot be loaded or lacks an entry point; the reason is traced.
  [[nodiscard]] static TEE_Result load(const TEE_UUID& uuid, std::unique_ptr<ta_library>* library);

  ta_library(const ta_library&) = delete;
  ta_library& operator=(const ta_library&) = delete;
  ~ta_library();

  const ta_entry_points& entries() const { return entries_; }

  // properties: what the trusted application says of itself: a text that it may export as
  // `extern "C" const char TA_Properties[]`, lines of the form name=value, such as
  // gpd.ta.dataSize=1048576 for the size of its heap in bytes.
  property_map properties() const;

 private:
  ta_library() = default;
  TEE_Result open(const std::string& path);
  TEE_Result open_private_copy(const std::string& path);
  bool find_entries(const std::string& path);

  void* handle_ = nullptr;
  std::string loaded_name_;
  file_descriptor copy_;  // keeps the name of a private copy from being used again
  ta_entry_points entries_{};
};

}  // namespace tee
