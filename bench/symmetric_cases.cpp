// HMAC and AES, and what handling a blob costs.
#include <algorithm>
#include <cstring>
#include <memory>
#include <stdexcept>

#include "bench/bare.h"
#include "bench/cases.h"

namespace keymaster::bench {
namespace {

constexpr size_t KEY_SIZE = 32;
constexpr size_t MAC_SIZE = 32;
constexpr size_t GCM_NONCE_SIZE = 12;
constexpr size_t BLOCK_SIZE = 16;
constexpr size_t SMALL = 64;
constexpr size_t HMAC_BULK = size_t{1} << 20;
constexpr size_t AES_BULK = size_t{16} << 20;
constexpr size_t HMAC_MATERIAL_HEADER = 8;
constexpr size_t AES_MATERIAL_HEADER = 4;

void expect_equal(byte_view a, byte_view b, const std::string& what) {
  if (!std::equal(a.begin(), a.end(), b.begin(), b.end())) {
    throw std::runtime_error(what + ": the ways do not agree");
  }
}

std::string size_text(size_t size) {
  return size < 1024 ? std::to_string(size) + "B" : std::to_string(size >> 20) + "MiB";
}

param_set hmac_description() {
  return param_set()
      .add(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)
      .add(KM_TAG_KEY_SIZE, KEY_SIZE * 8)
      .add(KM_TAG_MIN_MAC_LENGTH, MAC_SIZE * 8)
      .add_flag(KM_TAG_NO_AUTH_REQUIRED);
}

param_set aes_description(uint32_t block_mode) {
  param_set description;
  description.add(KM_TAG_ALGORITHM, KM_ALGORITHM_AES)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_DECRYPT)
      .add(KM_TAG_BLOCK_MODE, block_mode)
      .add(KM_TAG_PADDING, KM_PAD_NONE)
      .add(KM_TAG_KEY_SIZE, KEY_SIZE * 8)
      .add_flag(KM_TAG_NO_AUTH_REQUIRED);
  if (block_mode == KM_MODE_GCM) description.add(KM_TAG_MIN_MAC_LENGTH, BLOCK_SIZE * 8);
  return description;
}

// hmac_work: a MAC over `size` bytes.
struct hmac_work {
  hmac_work(secure_world* world, size_t size)
      : key(pattern(KEY_SIZE)),
        data(pattern(size)),
        blob(world->import_key(hmac_description(), key)),
        secure(world, KM_PURPOSE_SIGN, blob, param_set().add(KM_TAG_MAC_LENGTH, MAC_SIZE * 8),
               data),
        opener(world->device_id()),
        loaded(key),
        opened(key) {}

  void run_loaded() { loaded.compute(data, mac); }
  void run_chain() {
    opened.set_key(opener.open(blob).subspan(HMAC_MATERIAL_HEADER, KEY_SIZE));
    opened.compute(data, mac);
  }

  void check() {
    secure.run();
    run_loaded();
    expect_equal(secure.finished(), byte_view(mac).first(MAC_SIZE), "HMAC loaded");
    mac[0] ^= 1;
    run_chain();
    expect_equal(secure.finished(), byte_view(mac).first(MAC_SIZE), "HMAC chain");
  }

  bytes key;
  bytes data;
  bytes blob;
  operation secure;
  blob_opener opener;
  bare_hmac loaded;
  bare_hmac opened;
  uint8_t mac[EVP_MAX_MD_SIZE];
};

bench_case hmac_case(secure_world* world, size_t size) {
  auto work = std::make_shared<hmac_work>(world, size);
  work->check();
  return {"HMAC-SHA256 " + size_text(size), [work] { work->secure.run(); },
          [work] { work->run_loaded(); }, [work] { work->run_chain(); }};
}

struct cipher_row {
  const char* name;
  const char* algorithm;
  uint32_t block_mode;
  size_t nonce_size;
};

// cipher_work: an encryption of `size` bytes under a fresh random nonce.
struct cipher_work {
  cipher_work(secure_world* world, const cipher_row& mode, size_t size)
      : row(mode),
        key(pattern(KEY_SIZE)),
        data(pattern(size)),
        output(size),
        blob(world->import_key(aes_description(row.block_mode), key)),
        secure(world, KM_PURPOSE_ENCRYPT, blob, begin_params(), data),
        opener(world->device_id()),
        loaded(row.algorithm, true),
        opened(row.algorithm, true) {
    loaded.start(key, {});
  }

  bool is_gcm() const { return row.block_mode == KM_MODE_GCM; }

  param_set begin_params() const {
    param_set params;
    params.add(KM_TAG_BLOCK_MODE, row.block_mode);
    if (is_gcm()) params.add(KM_TAG_MAC_LENGTH, BLOCK_SIZE * 8);
    return params;
  }

  void encrypt(bare_cipher* cipher, view with_key) {
    random_bytes(std::span(nonce).first(row.nonce_size));
    cipher->start(with_key, view(nonce).first(row.nonce_size));
    cipher->update(data, output.data());
    if (is_gcm()) {
      cipher->make_tag(tag);
    } else {
      cipher->finish();
    }
  }
  void run_loaded() { encrypt(&loaded, {}); }
  void run_chain() { encrypt(&opened, opener.open(blob).subspan(AES_MATERIAL_HEADER, KEY_SIZE)); }

  // What the trusted application encrypted comes out right, and the chain finds the same key.
  void check() {
    secure.run();
    const bytes its_nonce = param_set::parse(secure.begun()).find(KM_TAG_NONCE)->data;
    bare_cipher decryption(row.algorithm, false);
    decryption.start(opener.open(blob).subspan(AES_MATERIAL_HEADER, KEY_SIZE), its_nonce);
    decryption.update(secure.updated(), output.data());
    if (is_gcm()) decryption.check_tag(secure.finished());
    expect_equal(output, data, row.name);
  }

  cipher_row row;
  bytes key;
  bytes data;
  bytes output;
  bytes blob;
  operation secure;
  blob_opener opener;
  bare_cipher loaded;
  bare_cipher opened;
  uint8_t nonce[BLOCK_SIZE];
  uint8_t tag[BLOCK_SIZE];
};

bench_case cipher_case(secure_world* world, const cipher_row& row, size_t size) {
  auto work = std::make_shared<cipher_work>(world, row, size);
  work->check();
  return {std::string(row.name).append(" ").append(size_text(size)), [work] { work->secure.run(); },
          [work] { work->run_loaded(); }, [work] { work->run_chain(); }};
}

// generate_case: a new symmetric key in a blob of the size that the trusted application makes.
bench_case generate_case(secure_world* world, const std::string& name,
                         const param_set& description) {
  struct work_t {
    work_t(secure_world* world, const param_set& description)
        : secure(world, client::command::GENERATE_KEY, description.marshal(), 4096),
          opener(world->device_id()) {
      secure.run();
      plaintext.resize(opener.open_all(secure.output()).size());
    }
    command secure;
    blob_opener opener;
    bytes plaintext;
  };
  auto work = std::make_shared<work_t>(world, description);
  const auto draw = [work] { random_bytes(std::span(work->plaintext).first(KEY_SIZE)); };
  return {"generate " + name, [work] { work->secure.run(); }, draw,
          [work, draw] {
            draw();
            work->opener.seal(work->plaintext);
          }};
}

// open_case: a blob opened and described, without an operation.
bench_case open_case(secure_world* world) {
  struct work_t {
    explicit work_t(secure_world* world)
        : blob(world->generate_key(hmac_description())),
          secure(world, client::command::GET_KEY_CHARACTER,
                 client::field_writer().field(blob).field({}).field({}).take(), 4096),
          opener(world->device_id()) {
      secure.run();
    }
    bytes blob;
    command secure;
    blob_opener opener;
  };
  auto work = std::make_shared<work_t>(world);
  return {"open blob", [work] { work->secure.run(); }, nullptr,
          [work] { work->opener.open(work->blob); }};
}

}  // namespace

std::vector<bench_case> symmetric_cases(secure_world* world) {
  constexpr cipher_row GCM = {"AES-256-GCM", "AES-256-GCM", KM_MODE_GCM, GCM_NONCE_SIZE};
  constexpr cipher_row CBC = {"AES-256-CBC", "AES-256-CBC", KM_MODE_CBC, BLOCK_SIZE};
  constexpr cipher_row CTR = {"AES-256-CTR", "AES-256-CTR", KM_MODE_CTR, BLOCK_SIZE};
  return {
      open_case(world),
      generate_case(world, "HMAC", hmac_description()),
      generate_case(world, "AES", aes_description(KM_MODE_GCM)),
      hmac_case(world, SMALL),
      hmac_case(world, HMAC_BULK),
      cipher_case(world, GCM, SMALL),
      cipher_case(world, GCM, AES_BULK),
      cipher_case(world, CBC, AES_BULK),
      cipher_case(world, CTR, AES_BULK),
  };
}

}  // namespace keymaster::bench
