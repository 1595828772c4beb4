// Public keys in DER: the DER SubjectPublicKeyInfo (RFC 5280) of an RSA key (RFC 3279, RFC 8017).
#include "ports/adapter/operations.h"
#include "ta/der/der.h"

namespace keymaster::adapter {
namespace {

// Tags and lengths around the two numbers, and the algorithm's identifier, in bytes at most.
constexpr size_t MAX_FRAME = 64;

constexpr uint64_t RSA_ENCRYPTION[] = {1, 2, 840, 113549, 1, 1, 1};

// Each value's parts from last to first, as the writer goes backwards. The sum of lengths, or the
// writer's negative code.
int32_t sum(int32_t a, int32_t b) {
  if (a < 0) return a;
  return b < 0 ? b : a + b;
}

int32_t write_key(der_cursor* out, const known_operation& operation) {
  const int32_t exponent = der_write_integer(out, operation.exponent.view());
  const int32_t numbers = sum(exponent, der_write_integer(out, operation.modulus.view()));
  const int32_t sequence = der_wrap(out, DER_SEQUENCE, numbers);
  constexpr uint8_t NO_UNUSED_BITS[] = {0};
  return der_wrap(out, DER_BIT_STRING, sum(sequence, der_write_bytes(out, NO_UNUSED_BITS)));
}

int32_t write_algorithm(der_cursor* out) {
  const int32_t parameters = der_write_null(out);
  return der_wrap(out, DER_SEQUENCE, sum(parameters, der_write_oid(out, RSA_ENCRYPTION)));
}

int32_t write_spki(der_cursor* out, const known_operation& operation) {
  const int32_t key = write_key(out, operation);
  return der_wrap(out, DER_SEQUENCE, sum(key, write_algorithm(out)));
}

}  // namespace

// Defined under its own name: no standard platform has it.
extern "C" TEE_Result TEE_AsymmetricExport(TEE_OperationHandle operation, uint32_t format,
                                           void* buffer, tee_size* length) {
  const known_operation* known = find_operation(operation);
  if (known == nullptr || known->purpose != role::EXPORT || !known->modulus) {
    return TEE_ERROR_BAD_STATE;
  }
  if (format != TEE_EXPORT_FORMAT_SPKI) return TEE_ERROR_NOT_SUPPORTED;
  heap_buffer room;
  if (!room.allocate(known->modulus.size() + known->exponent.size() + MAX_FRAME)) {
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  der_cursor out(room.span());
  if (write_spki(&out, *known) < 0) return TEE_ERROR_GENERIC;
  const byte_view spki = out.written();
  const tee_size capacity = *length;
  *length = static_cast<tee_size>(spki.size());
  if (spki.size() > capacity) return TEE_ERROR_SHORT_BUFFER;
  copy_bytes({static_cast<uint8_t*>(buffer), capacity}, spki);
  return TEE_SUCCESS;
}

}  // namespace keymaster::adapter
