/*
 * A pseudo TA of OP-TEE's core that keeps what lasts for one boot: the seed from which the tokens of
 * authenticators get their key, and whether the Keymaster has run. Uses of keys that are limited for
 * a boot are counted in the Keymaster's instance, which lives as long as the boot does; were it
 * ended before, a second one would count from zero, so it is not given a seed and cannot start.
 */
#include <crypto/crypto.h>
#include <kernel/pseudo_ta.h>
#include <kernel/tee_ta_manager.h>
#include <kernel/ts_manager.h>
#include <kernel/user_ta.h>
#include <string.h>

#include "boot_seed.h"
#include "product/uuids.h"

static const TEE_UUID keymaster = KEYMASTER_TA_UUID;

/* Those beside the Keymaster that sign tokens. */
static const TEE_UUID authenticators[] = {AUTHENTICATOR_TA_UUID, FINGERPRINT_TA_UUID};

/* Calls of a pseudo TA that is not marked concurrent come one at a time. */
static uint8_t seed[BOOT_SEED_SIZE];
static bool seed_made;
static bool keymaster_has_run;

static bool same_uuid(const TEE_UUID* a, const TEE_UUID* b) {
  return memcmp(a, b, sizeof(*a)) == 0;
}

/* The identifier of the trusted application that calls; null for callers of the normal world. */
static const TEE_UUID* calling_ta(void) {
  struct ts_session* caller = ts_get_calling_session();

  if (!caller || !is_user_ta_ctx(caller->ctx)) return NULL;
  return &caller->ctx->uuid;
}

static bool is_authenticator(const TEE_UUID* uuid) {
  size_t i = 0;

  for (i = 0; i < sizeof(authenticators) / sizeof(authenticators[0]); i++) {
    if (same_uuid(uuid, &authenticators[i])) return true;
  }
  return false;
}

static TEE_Result admit(const TEE_UUID* caller) {
  if (!caller) return TEE_ERROR_ACCESS_DENIED;
  if (!same_uuid(caller, &keymaster)) {
    return is_authenticator(caller) ? TEE_SUCCESS : TEE_ERROR_ACCESS_DENIED;
  }
  if (keymaster_has_run) return TEE_ERROR_BAD_STATE;
  keymaster_has_run = true;
  return TEE_SUCCESS;
}

static TEE_Result make_seed(void) {
  TEE_Result res = TEE_SUCCESS;

  if (seed_made) return TEE_SUCCESS;
  res = crypto_rng_read(seed, sizeof(seed));
  if (res == TEE_SUCCESS) seed_made = true;
  return res;
}

static TEE_Result get_seed(uint32_t types, TEE_Param params[TEE_NUM_PARAMS]) {
  const uint32_t wanted = TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_OUTPUT, TEE_PARAM_TYPE_NONE,
                                          TEE_PARAM_TYPE_NONE, TEE_PARAM_TYPE_NONE);
  TEE_Param bounced[TEE_NUM_PARAMS] = {};
  TEE_Param* reached = NULL;
  TEE_Result res = TEE_SUCCESS;

  if (types != wanted || params[0].memref.size != BOOT_SEED_SIZE) return TEE_ERROR_BAD_PARAMETERS;
  res = make_seed();
  if (res == TEE_SUCCESS) res = admit(calling_ta());
  if (res == TEE_SUCCESS) res = to_bounce_params(types, params, bounced, &reached);
  if (res != TEE_SUCCESS) return res;
  memcpy(reached[0].memref.buffer, seed, sizeof(seed));
  return from_bounce_params(types, params, bounced, reached);
}

static TEE_Result invoke(void* session, uint32_t command, uint32_t types,
                         TEE_Param params[TEE_NUM_PARAMS]) {
  (void)session;
  return command == BOOT_SEED_GET ? get_seed(types, params) : TEE_ERROR_NOT_IMPLEMENTED;
}

pseudo_ta_register(.uuid = BOOT_SEED_PTA_UUID, .name = "boot_seed.pta",
                   .flags = PTA_DEFAULT_FLAGS, .invoke_command_entry_point = invoke);
