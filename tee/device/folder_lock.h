// The lock of a device folder: one process at a time.
#pragma once

#include <string>

#include "tee/device/files.h"

namespace tee {

// Holds the device in `folder` for this process while it lives. The constructor throws
// device_error: BUSY, naming the holder's process id, while someone else (in this process, too)
// holds it.
class folder_lock {
 public:
  explicit folder_lock(const std::string& folder);
  folder_lock(const folder_lock&) = delete;
  folder_lock& operator=(const folder_lock&) = delete;
  ~folder_lock();

 private:
  file_descriptor file_;
};

}  // namespace tee
