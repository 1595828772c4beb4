// An instance of a trusted application: everything that the TEE keeps for it, and which one runs on
// the calling thread.
#pragma once

#include "tee_internal_api.h"

#include <memory>
#include <optional>

#include "tee/core/cancellation.h"
#include "tee/core/handles.h"
#include "tee/core/heap.h"
#include "tee/core/live_counts.h"
#include "tee/core/object.h"
#include "tee/core/operation.h"
#include "tee/core/properties.h"
#include "tee/core/session.h"
#include "tee/crypto/key_cache.h"
#include "tee/device/device.h"

namespace tee {

class instance {
 public:
  // `heap_limit` in bytes. The device must outlive the instance, and so must `opener`, which
  // gives it sessions with other trusted applications; null: there are none.
  instance(const TEE_UUID& uuid, device& dev, size_t heap_limit, session_opener* opener = nullptr);
  instance(const instance&) = delete;
  instance& operator=(const instance&) = delete;
  ~instance();  // reclaims and wipes all that is left

  const TEE_UUID& uuid() const { return uuid_; }
  device& dev() { return device_; }
  heap& memory() { return memory_; }
  handle_table<object>& objects() { return objects_; }
  handle_table<operation>& operations() { return operations_; }
  handle_table<std::shared_ptr<session>>& sessions() { return sessions_; }
  session_opener* opener() { return opener_; }
  crypto::key_cache& keys() { return keys_; }
  crypto::digest_pool& digests() { return digests_; }

  // client: who called the entry point that runs; null in create and destroy. set_client copies.
  const TEE_Identity* client() const { return client_ ? &*client_ : nullptr; }
  void set_client(const TEE_Identity* client);

  // holds_of_client: whether the bytes share memory with a parameter of the entry point that runs,
  // which its client can read or change at any time.
  bool holds_of_client(const void* data, size_t length) const;

  // asked: what can end the entry point that runs early; null: nothing. Until the trusted
  // application says otherwise, it does not want to know (`cancellation_masked`).
  const cancellation* asked() const { return asked_; }
  void set_asked(const cancellation* asked) {
    asked_ = asked;
    cancellation_masked = true;
  }
  bool cancellation_masked = true;

  // heard: `asked` as far as it is not masked.
  const cancellation* heard() const { return cancellation_masked ? nullptr : asked_; }

  // reclaim: closes, frees and wipes all that the trusted application holds.
  void reclaim();

  // properties: the instance's gpd.ta.* and its own properties, by full name. gpd.ta.appID is there
  // from the start, and defaults of those that every trusted application has.
  property_map& properties() { return properties_; }

  // counts: what the trusted application holds at the moment.
  live_counts counts() const;

 private:
  friend class instance_scope;

  TEE_UUID uuid_;
  device& device_;
  heap memory_;
  crypto::key_cache keys_;
  crypto::digest_pool digests_;  // outlives the operations
  handle_table<object> objects_;
  handle_table<operation> operations_;
  handle_table<std::shared_ptr<session>> sessions_;
  session_opener* opener_;
  std::optional<TEE_Identity> client_;
  const call_parameters* parameters_ = nullptr;  // of the entry point that runs, if it has any
  const cancellation* asked_ = nullptr;
  property_map properties_;
};

// Makes an instance the one that runs on this thread, in an entry point with those parameters, for
// the life of the scope. Scopes nest, since a trusted application may call another one.
class instance_scope {
 public:
  explicit instance_scope(instance& running, const call_parameters* parameters = nullptr);
  instance_scope(const instance_scope&) = delete;
  instance_scope& operator=(const instance_scope&) = delete;
  ~instance_scope();

 private:
  instance* outer_;
  const call_parameters* outer_parameters_;
};

// current_instance: the one that runs on this thread; panics in the name of `call` when none does.
instance& current_instance(const char* call);

}  // namespace tee
