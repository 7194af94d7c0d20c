// SPDX-License-Identifier: Apache-2.0
// The primitives against others': the crypt against the system's, SHA-1, DES and AES against OpenSSL's.
#include <crypt.h>
#include <openssl/evp.h>

#include "aes_keys.h"
#include "fuzz_input.h"
#include "password_schemes.h"

using namespace fuzz;

namespace {

std::string opensslCipher(const char* name, std::string_view key, std::string_view iv, std::string_view data,
                          bool padded, bool encrypts = true) {
  const std::unique_ptr<EVP_CIPHER_CTX, void (*)(EVP_CIPHER_CTX*)> context(EVP_CIPHER_CTX_new(), EVP_CIPHER_CTX_free);
  const auto bytes = [](std::string_view view) { return reinterpret_cast<const unsigned char*>(view.data()); };
  std::string out(data.size() + EVP_MAX_BLOCK_LENGTH, '\0');
  auto* to = reinterpret_cast<unsigned char*>(out.data());
  int written = 0;
  int last = 0;
  require(EVP_CipherInit_ex(context.get(), EVP_get_cipherbyname(name), nullptr, bytes(key), bytes(iv), encrypts) == 1);
  EVP_CIPHER_CTX_set_padding(context.get(), padded);
  require(EVP_CipherUpdate(context.get(), to, &written, bytes(data), static_cast<int>(data.size())) == 1);
  require(EVP_CipherFinal_ex(context.get(), to + written, &last) == 1);
  return out.substr(0, static_cast<size_t>(written + last));
}

void tryCrypt(Input& input) {
  static const char kCharacters[] = "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
  const char characters[] = {kCharacters[input.byte() % 64], kCharacters[input.byte() % 64]};
  const Block salt = Block::text({characters, 2});
  const Block key = Block::text(input.take(255));  // the system's refuses very long ones
  ldappw_crypt_data state;
  static crypt_data system;
  require(crypt_r(key.text(), salt.text(), &system) == std::string(_crypt_r(key.text(), salt.text(), &state)));
}

void trySha(Input& input) {
  const Block data(input.rest());
  unsigned char expected[EVP_MAX_MD_SIZE];
  sha_digest digest;
  SHA(data.text(), data.view().size(), &digest);
  require(EVP_Digest(data.text(), data.view().size(), expected, nullptr, EVP_sha1(), nullptr) == 1);
  require(std::memcmp(expected, &digest, sizeof digest) == 0);
}

// One key as well as three, and every block of the input in both directions.
void tryDes(Input& input) {
  const bool isTriple = input.byte() % 2 == 1;
  Block key(isTriple ? 24 : 8);
  input.take(key.view().size()).copy(key.text(), key.view().size());
  std::string three(key.view());
  while (three.size() < 24) three += key.view();
  for (std::string_view data = input.take(8); data.size() == 8; data = input.take(8)) {
    for (const int decrypt : {0, 1}) {
      const Block schedule(isTriple ? 384 : 128);
      auto* words = reinterpret_cast<uint32_t*>(schedule.text());
      (isTriple ? des3key : deskey)(words, key.bytes(), decrypt);
      const Block block(data);
      for (size_t i = 0; i < schedule.view().size() / 128; ++i) des(words + 32 * i, block.bytes());
      require(block.view() == opensslCipher("DES-EDE3-ECB", three, "", data, false, decrypt == 0));
    }
  }
}

void tryAes(Input& input) {
  static const struct {
    const char* name;
    size_t keyBytes, vectorBytes;
  } rows[] = {{"AES-128-ECB", 16, 0},  {"AES-192-ECB", 24, 0},  {"AES-256-ECB", 32, 0},
              {"AES-128-CBC", 16, 16}, {"AES-256-CTR", 32, 16}, {"AES-192-OFB", 24, 16}};
  const auto& row = rows[input.byte() % std::size(rows)];
  const Block key(row.keyBytes);
  input.take(row.keyBytes).copy(key.text(), row.keyBytes);
  const Block vector(input.take(input.byte() % 24));
  const Block clear(input.rest());
  std::string whole(vector.view().substr(0, row.vectorBytes));
  whole.resize(row.vectorBytes);
  const SecBuffer keyBuffer{key.bytes(), 0};
  const SecBuffer vectorBuffer{vector.bytes(), static_cast<uint32_t>(vector.length())};

  char* text = nullptr;
  char* opened = nullptr;
  int length = -1;
  require(aesEncryptBuffer(clear.text(), &text, row.name, &keyBuffer, &vectorBuffer, clear.length()) == 0);
  unsigned rawLength = 0;
  const Made<unsigned char> raw(base64ToBinaryBlob(text, &rawLength));
  require(std::string_view(reinterpret_cast<char*>(raw.get()), rawLength) ==
          opensslCipher(row.name, key.view(), whole, clear.view(), true));
  require(aesDecryptBuffer(text, &opened, row.name, &keyBuffer, &vectorBuffer, &length) == 0);
  require(std::string_view(opened, static_cast<size_t>(length)) == clear.view() && opened[length] == '\0');
  std::free(text);
  std::free(opened);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static void (*const kTries[])(Input&) = {tryCrypt, trySha, tryDes, tryAes};
  Input input(data, size);
  kTries[input.byte() % 4](input);
  return 0;
}
