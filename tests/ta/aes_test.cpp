// AES through the command interface: published vectors, streams in pieces of every size, and what
// is refused.
#include "support/sets.h"
#include "support/ta_under_test.h"

namespace keymaster::test {
namespace {

using client::from_hex;
using namespace std::string_literals;

constexpr size_t BLOCK = 16;

const param_set ANY_USE = any_use(KM_ALGORITHM_AES);

// What a begin asks for; 0 and an empty nonce leave the parameter out.
param_set use(uint32_t mode, uint32_t padding = 0, uint32_t mac_bits = 0, byte_view nonce = {}) {
  param_set params = one(KM_TAG_BLOCK_MODE, mode);
  if (padding != 0) params.add(KM_TAG_PADDING, padding);
  if (mac_bits != 0) params.add(KM_TAG_MAC_LENGTH, mac_bits);
  if (!nonce.empty()) params.add_bytes(KM_TAG_NONCE, nonce);
  return params;
}

param_set associated(byte_view data) {
  return param_set().add_bytes(KM_TAG_ASSOCIATED_DATA, data);
}

struct stream_vector {
  std::string name;  // and in pieces of how many bytes
  uint32_t mode;
  uint32_t padding;
  uint32_t mac_bits;
  const char* key;
  const char* nonce;
  const char* associated_data;
  const char* plaintext;
  const char* ciphertext;  // with the tag behind it

  size_t tag_size() const { return mac_bits / 8; }
  param_set params() const { return use(mode, padding, mac_bits, from_hex(nonce)); }
};

constexpr char KEY_128[] = "2b7e151628aed2a6abf7158809cf4f3c";
constexpr char GCM_KEY[] = "feffe9928665731c6d6a8f9467308308";
constexpr char GCM_NONCE[] = "cafebabefacedbaddecaf888";
constexpr char GCM_AAD[] = "feedfacedeadbeeffeedfacedeadbeefabaddad2";
constexpr char COUNTING_IV[] = "000102030405060708090a0b0c0d0e0f";
#define FORTY_BYTES                                                  \
  "6bc1bee22e409f96e93d7e117393172aae2d8a571e03ac9c9eb76fac45af8e51" \
  "30c81c46a35ce411"
#define FOUR_BLOCKS FORTY_BYTES "e5fbc1191a0a52eff69f2445df4f9b17ad2b417be66c3710"
#define GCM_FORTY                                                    \
  "d9313225f88406e5a55909c5aff5269a86a7a9531534f7da2e4c303d8a318a72" \
  "1c3c0c9595680953"
#define GCM_FORTY_SEALED                                             \
  "42831ec2217774244b7221b784d0d49ce3aa212f2c02a4e035c17e2329aca12e" \
  "21d514b25466931c"

// The first four are those of NIST SP 800-38A and of the GCM proposal (test case 4); the 40-byte
// ones were made with the openssl command and an independent GCM.
const stream_vector VECTORS[] = {
    {"ECB 128", KM_MODE_ECB, KM_PAD_NONE, 0, KEY_128, "", "", FOUR_BLOCKS,
     "3ad77bb40d7a3660a89ecaf32466ef97f5d3d58503b9699de785895a96fdbaaf"
     "43b1cd7f598ece23881b00e3ed0306887b0c785e27e8ad3f8223207104725dd4"},
    {"CBC 256", KM_MODE_CBC, KM_PAD_NONE, 0,
     "603deb1015ca71be2b73aef0857d77811f352c073b6108d72d9810a30914dff4", COUNTING_IV, "",
     FOUR_BLOCKS,
     "f58c4c04d6e5f1ba779eabfb5f7bfbd69cfc4e967edb808d679f777bc6702c7d"
     "39f23369a9d9bacfa530e26304231461b2eb05e2c39be9fcda6c19078c6a9d1b"},
    {"CTR 192", KM_MODE_CTR, KM_PAD_NONE, 0, "8e73b0f7da0e6452c810f32b809079e562f8ead2522c6b7b",
     "f0f1f2f3f4f5f6f7f8f9fafbfcfdfeff", "", FOUR_BLOCKS,
     "1abc932417521ca24f2b0459fe7e6e0b090339ec0aa6faefd5ccc2c6f4ce8e94"
     "1e36b26bd1ebc670d1bd1d665620abf74f78a7f6d29809585a97daec58c6b050"},
    {"GCM 128", KM_MODE_GCM, KM_PAD_NONE, 128, GCM_KEY, GCM_NONCE, GCM_AAD,
     GCM_FORTY "2fcf0e2449a6b525b16aedf5aa0de657ba637b39",
     GCM_FORTY_SEALED "7d8f6a5aac84aa051ba30b396a0aac973d58e0915bc94fbc3221a5db94fae95ae7121a47"},
    {"CBC PKCS7, 40 bytes", KM_MODE_CBC, KM_PAD_PKCS7, 0, KEY_128, COUNTING_IV, "", FORTY_BYTES,
     "7649abac8119b246cee98e9b12e9197d5086cb9b507219ee95db113a917678b2"
     "5caca76145cffc65f7483608c531aef1"},
    {"GCM, 40 bytes, 96-bit tag", KM_MODE_GCM, KM_PAD_NONE, 96, GCM_KEY, GCM_NONCE, GCM_AAD,
     GCM_FORTY, GCM_FORTY_SEALED "57c3b9a3a267920b9af8a26d"},
};

// How many bytes must have come out once `fed` bytes went in, before finish.
size_t due(const stream_vector& v, uint32_t purpose, size_t fed) {
  if (v.mode == KM_MODE_CTR) return fed;
  if (v.mode == KM_MODE_GCM) return purpose == ENCRYPT ? fed : fed - std::min(fed, v.tag_size());
  const bool holds_block = purpose == DECRYPT && v.padding == KM_PAD_PKCS7 && fed > 0;
  return (holds_block ? fed - 1 : fed) / BLOCK * BLOCK;
}

// Runs the input through in updates of `piece` bytes, each with exactly the room that its output
// takes; the associated data comes in two halves, the second one together with the first piece.
bytes stream(ta_under_test* ta, const stream_vector& v, uint32_t purpose, byte_view blob,
             byte_view input, size_t piece) {
  const uint32_t handle = ta->begun(purpose, blob, v.params());
  const bytes aad = from_hex(v.associated_data);
  const byte_view halves[] = {byte_view(aad).first(aad.size() / 2),
                              byte_view(aad).subspan(aad.size() / 2)};
  const auto some = [&](byte_view data) { return aad.empty() ? param_set() : associated(data); };
  EXPECT_TRUE(succeeded(ta->update(handle, {}, some(halves[0]))));
  bytes output;
  for (size_t fed = 0; fed < input.size(); fed += piece) {
    const size_t next = std::min(input.size(), fed + piece);
    const reply step = ta->send_well(step_request(
        command::UPDATE, handle, input.subspan(fed, next - fed),
        fed == 0 ? some(halves[1]) : param_set(), due(v, purpose, next) - due(v, purpose, fed)));
    EXPECT_EQ(step.b, next - fed);
    client::append(&output, step.output());
    EXPECT_EQ(output.size(), due(v, purpose, next)) << "after " << next << " bytes";
  }
  client::append(&output, finished(ta->send_well(step_request(command::FINISH, handle))));
  return output;
}

class aes : public testing::Test {
 protected:
  ta_under_test ta;
  const bytes blob = ta.import(ANY_USE, from_hex(KEY_128));
  const param_set gcm = use(KM_MODE_GCM, KM_PAD_NONE, 96);
  const param_set padded = use(KM_MODE_CBC, KM_PAD_PKCS7);
};

TEST_F(aes, makes_and_takes_the_vectors_in_pieces_of_every_size) {
  for (const stream_vector& v : VECTORS) {
    ta.watch_secret(from_hex(v.key));
    const bytes its_blob = ta.import(ANY_USE, from_hex(v.key));
    const bytes plain = from_hex(v.plaintext);
    const bytes cipher = from_hex(v.ciphertext);
    for (size_t piece = 1; piece <= 65; piece += piece < 20 ? 1 : 45) {
      SCOPED_TRACE(v.name + std::to_string(piece));
      EXPECT_EQ(stream(&ta, v, ENCRYPT, its_blob, plain, piece), cipher);
      EXPECT_EQ(stream(&ta, v, DECRYPT, its_blob, cipher, piece), plain);
    }
  }
}

// What two updates and finish give. The updates' outputs lie `output_at` bytes behind the start of
// their inputs, in which four bytes of length are in front of the data.
bytes shared(ta_under_test* ta, uint32_t purpose, const param_set& begun, byte_view blob,
             byte_view input, size_t first, std::optional<ptrdiff_t> output_at) {
  const uint32_t handle = ta->begun(purpose, blob, begun);
  bytes output;
  for (const byte_view part : {input.first(first), input.subspan(first)}) {
    request update = step_request(command::UPDATE, handle, part, {}, part.size() + 2 * BLOCK);
    update.output_at = output_at;
    client::append(&output, ta->send_well(update).output());
  }
  client::append(&output, finished(ta->send_well(step_request(command::FINISH, handle))));
  return output;
}

// Short texts, and one that is longer than what the TA takes into its memory at once.
TEST_F(aes, output_may_lie_anywhere_over_the_input) {
  for (const stream_vector& v : VECTORS) {
    const bytes its_blob = ta.import(ANY_USE, from_hex(v.key));
    for (const size_t blocks : {3U, 800U}) {
      bytes plain(blocks * BLOCK);
      for (size_t i = 0; i < plain.size(); i++)
        plain[i] = static_cast<uint8_t>(i * i >> 4);
      const bytes sealed = shared(&ta, ENCRYPT, v.params(), its_blob, plain, BLOCK, {});
      for (const ptrdiff_t at : {-40, -4, 0, 3, 4, 5, 19, 20, 21, 37, 4099, 5000, 12000}) {
        for (const size_t first : {BLOCK, 2 * BLOCK - 1, plain.size() - BLOCK}) {
          SCOPED_TRACE(v.name + ", from byte " + std::to_string(at) + ", " + std::to_string(first));
          EXPECT_EQ(shared(&ta, ENCRYPT, v.params(), its_blob, plain, first, at), sealed);
          EXPECT_EQ(shared(&ta, DECRYPT, v.params(), its_blob, sealed, first, at), plain);
        }
      }
    }
  }
}

TEST_F(aes, keys_are_checked) {
  const std::string no_minimum = "No or too many KM_TAG_MIN_MAC_LENGTH";
  const std::string minimum = "Invalid KM_TAG_MIN_MAC_LENGTH ";
  const param_set good = with(ANY_USE, KM_TAG_KEY_SIZE, {128});
  const bad_key rows[] = {
      {ANY_USE, -38, "No or too many KM_TAG_KEY_SIZE or specified"},
      {with(good, KM_TAG_KEY_SIZE, {160}), -6, "Invalid AES key size 160"},
      {with(good, KM_TAG_MIN_MAC_LENGTH, {}), -58, no_minimum},
      {with(good, KM_TAG_MIN_MAC_LENGTH, {96, 96}), -58, no_minimum},
      {with(good, KM_TAG_MIN_MAC_LENGTH, {88}), -59, minimum + "88"},
      {with(good, KM_TAG_MIN_MAC_LENGTH, {100}), -59, minimum + "100"},
      {with(good, KM_TAG_MIN_MAC_LENGTH, {136}), -59, minimum + "136"},
      {with(good, KM_TAG_BLOCK_MODE, {KM_MODE_ECB}), -38,
       "Found KM_TAG_MIN_MAC_LENGTH without GCM"},
      {ANY_USE, -6, "Invalid AES key size 160", bytes(20)},
      {good, -44, "Key size mismatch (given 128, guessed 256)", bytes(32)},
  };
  ta.expect_refused_keys("aes_", rows);
}

TEST_F(aes, new_keys_say_where_they_come_from_and_stay_inside) {
  const bytes imported = ta.import(ANY_USE, bytes(24, 7));
  const bytes generated = ta.generate(with(ANY_USE, KM_TAG_KEY_SIZE, {256}));
  for (const auto& [made, origin, bits] :
       {std::tuple(imported, KM_ORIGIN_IMPORTED, 192u), {generated, KM_ORIGIN_GENERATED, 256u}}) {
    const param_set found = ta.characteristics(made);
    EXPECT_EQ(found.number(KM_TAG_KEY_SIZE), bits);
    EXPECT_EQ(found.number(KM_TAG_ORIGIN), origin);
    EXPECT_EQ(found.number(KM_TAG_CREATION_DATETIME), START_REE_MS / 1000 * 1000);
    ta.expect_refused(key_request(command::EXPORT_KEY, made), -17);
  }
  const bytes text(48, 9);
  const bytes sealed = ta.run(ENCRYPT, generated, use(KM_MODE_ECB), text);
  EXPECT_NE(sealed, text);
  EXPECT_EQ(ta.run(DECRYPT, generated, use(KM_MODE_ECB), sealed), text);
}

TEST_F(aes, begin_refuses) {
  const bytes twelve(12, 1);
  const bytes block(BLOCK, 1);
  // What create traces, if anything.
  for (const auto& [params, error, message] :
       {std::tuple(one(KM_TAG_PADDING, KM_PAD_NONE), -38, "No or too many KM_TAG_BLOCK_MODE"),
        {use(KM_MODE_GCM), -38, "No or too many KM_TAG_MAC_LENGTH"},
        {use(KM_MODE_GCM, KM_PAD_NONE, 136), -9, "Unsupported mac length 136"},
        {use(KM_MODE_GCM, KM_PAD_NONE, 100), -9, "Unsupported mac length 100"},
        {use(KM_MODE_GCM, KM_PAD_PKCS7, 128), -11, ""},
        {use(KM_MODE_CTR, KM_PAD_PKCS7), -11, ""},
        {use(KM_MODE_CBC, KM_PAD_RSA_PSS), -11, ""},
        {use(UNKNOWN_MODE), -7, ""},
        {use(KM_MODE_ECB, KM_PAD_NONE, 0, block), -40, ""},
        {use(KM_MODE_CBC, KM_PAD_NONE, 0, twelve), -38, ""},
        {use(KM_MODE_CTR).add_bytes(KM_TAG_NONCE, {}), -38, ""},
        {use(KM_MODE_GCM, KM_PAD_NONE, 128, block), -38, ""}}) {
    for (const auto& [purpose, create] :
         {std::pair(ENCRYPT, "create_aes_encrypt: "s), {DECRYPT, "create_aes_decrypt: "s}}) {
      ta.expect_refused(begin_request(purpose, blob, params), error,
                        *message == 0 ? "" : create + message);
      EXPECT_TRUE(ta.trace().has("begin: Create operation failed")) << error;
    }
  }
  ta.expect_refused(begin_request(SIGN, blob, use(KM_MODE_ECB)), -2);
  // Padding that is absent or repeated is NONE, for authorisation as well.
  const bytes only_padded =
      ta.import(with(ANY_USE, KM_TAG_PADDING, {KM_PAD_PKCS7}), from_hex(KEY_128));
  const param_set twice = use(KM_MODE_ECB, KM_PAD_PKCS7).append(one(KM_TAG_PADDING, KM_PAD_PKCS7));
  ta.expect_refused(begin_request(ENCRYPT, only_padded, use(KM_MODE_ECB)), -11);
  ta.expect_refused(begin_request(ENCRYPT, only_padded, twice), -11);
}

TEST_F(aes, nonces_are_put_out_given_or_drawn_also_for_decryption) {
  const auto nonce_of = [&](uint32_t purpose, const param_set& params) {
    const param_set out = param_set::parse(ta.try_begin(purpose, blob, params).output());
    return out.contains(KM_TAG_NONCE) ? out.find(KM_TAG_NONCE)->data : bytes();
  };
  const bytes given(BLOCK, 5);
  for (uint32_t purpose : {ENCRYPT, DECRYPT}) {
    EXPECT_EQ(nonce_of(purpose, use(KM_MODE_CTR, KM_PAD_NONE, 0, given)), given);
    EXPECT_EQ(nonce_of(purpose, use(KM_MODE_ECB)), bytes());
    EXPECT_EQ(nonce_of(purpose, use(KM_MODE_GCM, KM_PAD_NONE, 128)).size(), 12u);
    const bytes drawn = nonce_of(purpose, use(KM_MODE_CBC));
    EXPECT_EQ(drawn.size(), BLOCK);
    EXPECT_NE(drawn, nonce_of(purpose, use(KM_MODE_CBC)));
  }
}

TEST_F(aes, updates_refuse) {
  const bytes two(2 * BLOCK, 3);
  const byte_view first = byte_view(two).first(1);
  const param_set aad = associated(two);
  const struct {
    const char* name;
    uint32_t purpose;
    param_set begun;
    byte_view before;  // an earlier update
    byte_view input;
    param_set params;
    size_t room;
    TEEC_Result res;
    int32_t error;
  } rows[] = {
      {"late associated data", ENCRYPT, gcm, first, {}, aad, 64, 0, -40},
      {"late associated data", DECRYPT, gcm, first, {}, aad, 64, 0, -40},
      {"associated data twice", ENCRYPT, gcm, {}, two, associated(two).append(aad), 64, 0, -40},
      {"associated data without GCM", DECRYPT, padded, {}, two, aad, 64, 0, -40},
      {"little room", ENCRYPT, padded, {}, two, {}, 31, TEEC_ERROR_SHORT_BUFFER, 0},
      {"little room", DECRYPT, padded, {}, two, {}, 15, TEEC_ERROR_SHORT_BUFFER, 0},
      {"little room", DECRYPT, gcm, {}, two, {}, 19, TEEC_ERROR_SHORT_BUFFER, 0},
      {"little room for the block held back", DECRYPT, padded, two, first, {}, 15, 0, -41},
  };
  for (const auto& row : rows) {
    for (const auto output_at : {std::optional<ptrdiff_t>(), {4}}) {
      SCOPED_TRACE(row.name);
      const uint32_t handle = ta.begun(row.purpose, blob, row.begun);
      EXPECT_TRUE(succeeded(ta.update(handle, row.before)));
      request update = step_request(command::UPDATE, handle, row.input, row.params, row.room);
      update.output_at = output_at;
      const reply last = ta.send(update);
      EXPECT_EQ(last.res, row.res);
      EXPECT_EQ(last.km_error, row.error);
      EXPECT_EQ(last.b, 0U) << "nothing is consumed";
      EXPECT_EQ(last.output_size, 0U);
    }
  }
}

TEST_F(aes, streams_must_end_where_they_can) {
  for (const auto& [purpose, params, length, error] :
       {std::tuple(ENCRYPT, use(KM_MODE_ECB), 15u, -21),
        {ENCRYPT, use(KM_MODE_CBC), 17, -21},
        {ENCRYPT, use(KM_MODE_CBC), 0, 0},
        {DECRYPT, use(KM_MODE_ECB), 15, -21},
        {DECRYPT, padded, 17, -21},
        {DECRYPT, padded, 0, -21},
        {DECRYPT, gcm, 12, -30}}) {
    EXPECT_TRUE(refused(ta.try_run(purpose, blob, params, bytes(length, 3)), error)) << length;
    // Of padding alone it is said.
    EXPECT_EQ(ta.trace().has("aes_decrypt_finish: Input data not align to block size"),
              error == -21 && params.number(KM_TAG_PADDING) == KM_PAD_PKCS7 && purpose == DECRYPT);
  }
  // The front of a genuine tag is none.
  const param_set params = use(KM_MODE_GCM, KM_PAD_NONE, 96, bytes(12));
  const bytes tag = ta.run(ENCRYPT, blob, params, {});
  for (size_t length = 0; length <= tag.size(); length++) {
    const reply done = ta.try_run(DECRYPT, blob, params, byte_view(tag).first(length));
    EXPECT_TRUE(refused(done, length == tag.size() ? 0 : -30)) << length;
  }
}

TEST_F(aes, gcm_decryption_puts_out_text_and_refuses_its_tag_at_the_end) {
  const stream_vector& v = VECTORS[3];
  const bytes its_blob = ta.import(ANY_USE, from_hex(v.key));
  const bytes good = from_hex(v.ciphertext);
  for (size_t altered : {size_t{0}, good.size() - 17, good.size() - 16, good.size() - 1}) {
    bytes input = good;
    input[altered] ^= 1;
    const uint32_t handle = ta.begun(DECRYPT, its_blob, v.params());
    const reply body = ta.update(handle, input, associated(from_hex(v.associated_data)));
    EXPECT_EQ(body.output().size(), good.size() - 16);
    EXPECT_TRUE(refused(ta.finish(handle), -30)) << "byte " << altered;
  }
}

TEST_F(aes, padding_has_only_an_upper_bound) {
  // How many bytes at the end have which value, the answer, and the length of an accepted text.
  for (const auto& [count, last, error, length] : {std::tuple(1, 0, 0, 16u),
                                                   {1, 1, 0, 15},
                                                   {2, 2, 0, 14},
                                                   {1, 2, -38, 0},
                                                   {16, 16, 0, 0},
                                                   {15, 16, -38, 0},
                                                   {16, 17, -38, 0},
                                                   {16, 255, -38, 0}}) {
    bytes block(BLOCK, 9);
    std::fill(block.end() - count, block.end(), static_cast<uint8_t>(last));
    const bytes sealed = ta.run(ENCRYPT, blob, use(KM_MODE_ECB), block);
    const reply opened = ta.try_run(DECRYPT, blob, use(KM_MODE_ECB, KM_PAD_PKCS7), sealed);
    EXPECT_TRUE(refused(opened, error)) << "last byte " << last;
    EXPECT_EQ(opened.ok(), !ta.trace().has("aes_decrypt_finish: Illegal padding"));
    block.resize(length);
    EXPECT_EQ(finished(opened), block);
  }
}

}  // namespace
}  // namespace keymaster::test
