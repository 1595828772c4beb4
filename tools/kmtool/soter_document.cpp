// Files and signatures of SOTER documents.
#include "soter_document.h"

#include <array>
#include <cstdio>
#include <openssl/err.h>
#include <openssl/rsa.h>

#include "files.h"
#include "libcrypto.h"
#include "operands.h"

namespace kmtool {

using namespace keymaster;

namespace {

struct padding_row {
  const char* name;
  int number;
};
constexpr padding_row PADDINGS[] = {{"pkcs1", RSA_PKCS1_PADDING}, {"pss", RSA_PKCS1_PSS_PADDING}};

const EVP_MD* digest_of(uint32_t digest) {
  switch (digest) {
    case KM_DIGEST_MD5:
      return EVP_md5();
    case KM_DIGEST_SHA1:
      return EVP_sha1();
    case KM_DIGEST_SHA_2_224:
      return EVP_sha224();
    case KM_DIGEST_SHA_2_256:
      return EVP_sha256();
    case KM_DIGEST_SHA_2_384:
      return EVP_sha384();
    case KM_DIGEST_SHA_2_512:
      return EVP_sha512();
    default:
      throw failure(WRONG_USAGE, "--digest: a document is signed with a digest");
  }
}

owned<EVP_PKEY> public_key(const std::string& path, byte_view content) {
  EVP_PKEY* key = nullptr;
  const owned<OSSL_DECODER_CTX> context(OSSL_DECODER_CTX_new_for_pkey(
      &key, nullptr, nullptr, "RSA", EVP_PKEY_PUBLIC_KEY, nullptr, nullptr));
  if (!context) throw std::bad_alloc();
  const unsigned char* at = content.data();
  size_t length = content.size();
  const int done = OSSL_DECODER_from_data(context.get(), &at, &length);
  ERR_clear_error();
  owned<EVP_PKEY> found(key);
  if (done != 1 || !found) {
    throw failure(WRONG_USAGE, path + " holds no RSA public key", "It takes PEM or DER.");
  }
  return found;
}

bool verifies(EVP_PKEY* key, int rsa_padding, const EVP_MD* digest, byte_view data,
              byte_view signature) {
  const owned<EVP_MD_CTX> context(EVP_MD_CTX_new());
  EVP_PKEY_CTX* choices = nullptr;  // belongs to the context
  const bool good = context &&
                    EVP_DigestVerifyInit(context.get(), &choices, digest, nullptr, key) == 1 &&
                    EVP_PKEY_CTX_set_rsa_padding(choices, rsa_padding) == 1 &&
                    EVP_DigestVerify(context.get(), signature.data(), signature.size(), data.data(),
                                     data.size()) == 1;
  ERR_clear_error();
  return good;
}

}  // namespace

void document_files::add_to(CLI::App* verb, const std::string& document_help) {
  add_output(verb, "-o,--output", &document, document_help);
  add_output(verb, "--signature", &signature,
             "File for the document's signature (default: FILE.sig)");
}

void document_files::check(const std::string& key) const {
  if (document.empty() && !signature.empty()) {
    throw failure(WRONG_USAGE, "--signature: there is no -o for the document");
  }
  if (document == "-" && (signature.empty() || signature == "-")) {
    throw failure(WRONG_USAGE, "-o -: give --signature FILE for the signature");
  }
  if (signature.empty() && same_file(document + ".sig", key)) {
    throw failure(WRONG_USAGE, "the signature would go over the key: give --signature FILE");
  }
}

verb_result deliver(const client::signed_document& made, const document_files& files) {
  const std::string hex = client::to_hex(made.signature);
  verb_result result;
  result.object = {{"document", made.text()}, {"signature", hex}};
  if (files.document.empty()) {
    result.text = "document   " + escape_controls(made.text()) + "\nsignature  " + hex + "\n";
    return result;
  }
  const std::string beside = files.document + ".sig";
  const std::string& signature_file = files.signature.empty() ? beside : files.signature;
  write_file(signature_file, made.signature, access::NORMAL);
  write_file(files.document, made.document, access::NORMAL);
  result.object["output"] = files.document;
  result.object["signature_file"] = signature_file;
  if (files.document != "-" && signature_file != "-") {
    result.text = "Wrote the document (" + std::to_string(made.document.size()) +
                  " bytes with its zero byte) to " + files.document + " and its signature to " +
                  signature_file + "\n";
  }
  return result;
}

std::optional<std::string> verifying_padding(byte_view data, byte_view signature, uint32_t digest,
                                             const std::string& path, byte_view key) {
  const owned<EVP_PKEY> with = public_key(path, key);
  for (const padding_row& row : PADDINGS) {
    if (verifies(with.get(), row.number, digest_of(digest), data, signature)) return row.name;
  }
  return std::nullopt;
}

std::string escape_controls(std::string_view text) {
  std::string result;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte >= 0x20 && byte != 0x7F) {
      result += c;
      continue;
    }
    std::array<char, 8> escaped{};
    snprintf(escaped.data(), escaped.size(), "\\u%04x", byte);
    result += escaped.data();
  }
  return result;
}

}  // namespace kmtool
