// RSA and ECDSA.
#include <algorithm>
#include <memory>
#include <stdexcept>

#include "bench/bare_pkey.h"
#include "bench/cases.h"

namespace keymaster::bench {
namespace {

constexpr size_t MESSAGE_SIZE = 64;
constexpr size_t BLOB_ROOM = 8192;

struct key_kind {
  const char* name;
  uint32_t algorithm;
  uint32_t bits;
  pkey_ptr (*load)(view material);
};
constexpr key_kind RSA_2048 = {"RSA-2048", KM_ALGORITHM_RSA, 2048, rsa_pkey};
constexpr key_kind P_256 = {"P-256", KM_ALGORITHM_EC, 256, ec_pkey};
constexpr key_kind P_521 = {"P-521", KM_ALGORITHM_EC, 521, ec_pkey};

param_set description(const key_kind& kind) {
  param_set set;
  set.add(KM_TAG_ALGORITHM, kind.algorithm).add(KM_TAG_KEY_SIZE, kind.bits);
  for (uint32_t purpose :
       {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT, KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY})
    set.add(KM_TAG_PURPOSE, purpose);
  set.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256).add_flag(KM_TAG_NO_AUTH_REQUIRED);
  if (kind.algorithm != KM_ALGORITHM_RSA) return set;
  for (uint32_t padding : {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_PAD_RSA_PSS, KM_PAD_RSA_OAEP})
    set.add(KM_TAG_PADDING, padding);
  return set.add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537);
}

uint32_t padding_of(scheme how) {
  switch (how) {
    case scheme::PKCS1:
      return KM_PAD_RSA_PKCS1_1_5_SIGN;
    case scheme::PSS:
      return KM_PAD_RSA_PSS;
    case scheme::OAEP:
      return KM_PAD_RSA_OAEP;
    default:
      return 0;
  }
}

param_set begin_params(scheme how) {
  param_set params;
  if (how != scheme::ECDSA) params.add(KM_TAG_PADDING, padding_of(how));
  return params.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
}

// key_pair: a key of the trusted application that the bare side holds too.
struct key_pair {
  key_pair(secure_world* world, const key_kind& of)
      : kind(of),
        blob(world->generate_key(description(kind))),
        opener(world->device_id()),
        loaded(kind.load(opener.open(blob))) {}

  // The chain from the blob to a key.
  pkey_ptr open() { return kind.load(opener.open(blob)); }

  key_kind kind;
  bytes blob;
  blob_opener opener;
  pkey_ptr loaded;
  bytes message = pattern(MESSAGE_SIZE);
};
using key_pair_ptr = std::shared_ptr<key_pair>;

bench_case sign_case(secure_world* world, const key_pair_ptr& key, scheme how, const char* name) {
  auto secure = std::make_shared<operation>(world, KM_PURPOSE_SIGN, key->blob, begin_params(how),
                                            key->message);
  auto loaded = std::make_shared<bare_operation>(key->loaded.get(), how, way::SIGN);
  secure->run();
  bare_operation(key->loaded.get(), how, way::VERIFY).verify(key->message, secure->finished());
  return {name, [secure] { secure->run(); }, [key, loaded] { loaded->run(key->message); },
          [key, how] {
            const pkey_ptr opened = key->open();
            bare_operation(opened.get(), how, way::SIGN).run(key->message);
          }};
}

bench_case verify_case(secure_world* world, const key_pair_ptr& key, scheme how, const char* name) {
  bare_operation signer(key->loaded.get(), how, way::SIGN);
  const view made = signer.run(key->message);
  const auto signature = std::make_shared<bytes>(made.begin(), made.end());
  auto secure = std::make_shared<operation>(world, KM_PURPOSE_VERIFY, key->blob, begin_params(how),
                                            key->message, *signature);
  auto loaded = std::make_shared<bare_operation>(key->loaded.get(), how, way::VERIFY);
  secure->run();
  return {name, [secure] { secure->run(); },
          [key, loaded, signature] { loaded->verify(key->message, *signature); },
          [key, how, signature] {
            const pkey_ptr opened = key->open();
            bare_operation(opened.get(), how, way::VERIFY).verify(key->message, *signature);
          }};
}

bench_case decrypt_case(secure_world* world, const key_pair_ptr& key, const char* name) {
  bare_operation sealer(key->loaded.get(), scheme::OAEP, way::ENCRYPT);
  const view made = sealer.run(key->message);
  const auto sealed = std::make_shared<bytes>(made.begin(), made.end());
  auto secure = std::make_shared<operation>(world, KM_PURPOSE_DECRYPT, key->blob,
                                            begin_params(scheme::OAEP), *sealed);
  auto loaded = std::make_shared<bare_operation>(key->loaded.get(), scheme::OAEP, way::DECRYPT);
  secure->run();
  if (secure->finished() != key->message) throw std::runtime_error("OAEP: the ways do not agree");
  return {name, [secure] { secure->run(); }, [loaded, sealed] { loaded->run(*sealed); },
          [key, sealed] {
            const pkey_ptr opened = key->open();
            bare_operation(opened.get(), scheme::OAEP, way::DECRYPT).run(*sealed);
          }};
}

bench_case generate_case(secure_world* world, const key_pair_ptr& like, bare_generator bare) {
  auto secure = std::make_shared<command>(world, client::command::GENERATE_KEY,
                                          description(like->kind).marshal(), BLOB_ROOM);
  auto generator = std::make_shared<bare_generator>(std::move(bare));
  const view plaintext = like->opener.open_all(like->blob);
  const auto copy = std::make_shared<bytes>(plaintext.begin(), plaintext.end());
  return {std::string("generate ").append(like->kind.name), [secure] { secure->run(); },
          [generator] { generator->run(); },
          [generator, like, copy] {
            take_apart(generator->run().get());
            like->opener.seal(*copy);
          }};
}

}  // namespace

std::vector<bench_case> asymmetric_cases(secure_world* world) {
  const auto rsa = std::make_shared<key_pair>(world, RSA_2048);
  const auto p256 = std::make_shared<key_pair>(world, P_256);
  const auto p521 = std::make_shared<key_pair>(world, P_521);
  return {
      sign_case(world, rsa, scheme::PKCS1, "RSA-2048 sign PKCS#1"),
      sign_case(world, rsa, scheme::PSS, "RSA-2048 sign PSS"),
      verify_case(world, rsa, scheme::PKCS1, "RSA-2048 verify PKCS#1"),
      decrypt_case(world, rsa, "RSA-2048 decrypt OAEP"),
      sign_case(world, p256, scheme::ECDSA, "P-256 sign"),
      verify_case(world, p256, scheme::ECDSA, "P-256 verify"),
      sign_case(world, p521, scheme::ECDSA, "P-521 sign"),
      generate_case(world, rsa, bare_generator::rsa(RSA_2048.bits)),
      generate_case(world, p256, bare_generator::ec("P-256")),
  };
}

}  // namespace keymaster::bench
