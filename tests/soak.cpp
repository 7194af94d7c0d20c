// SPDX-License-Identifier: Apache-2.0
// Formats, verifies, refuses and reverses random passwords under every scheme, and watches the resident size. The
// number of passwords is the argument; a handful runs with the tests, a million on request (see CONTRIBUTING.md).
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <random>
#include <string>

#include "password_schemes.h"
#include "support.h"

namespace {

constexpr size_t kLongest = 200;

struct Scheme {
  int code;
  bool takesNul;
  size_t counted;  // the bytes of a password that count
};

constexpr Scheme kSchemes[] = {{FORMAT_SHA, true, kLongest},    {FORMAT_MD5, false, kLongest},
                               {FORMAT_CRYPT, false, 8},        {FORMAT_SSHA, false, kLongest},
                               {FORMAT_QVEIL, false, 46},       {FORMAT_AES128, true, kLongest},
                               {FORMAT_AES192, true, kLongest}, {FORMAT_AES256, true, kLongest}};

std::mt19937_64 generator(20260101);

size_t drawn(size_t first, size_t last) {
  return std::uniform_int_distribution<size_t>(first, last)(generator);
}

std::string randomPassword(bool withNul) {
  std::string password(drawn(0, kLongest), ' ');
  for (char& c : password) c = static_cast<char>(drawn(withNul ? 0 : 1, 255));
  return password;
}

// Another password that differs within the bytes that count, in a bit that counts.
std::string wrongOne(std::string password, const Scheme& scheme) {
  const size_t counted = std::min(password.size(), scheme.counted);
  if (counted == 0) return "x";
  char& c = password[drawn(0, counted - 1)];
  c = static_cast<char>(c ^ 2);
  if (!scheme.takesNul && (c & 0x7f) == 0) c = static_cast<char>(c ^ 4);
  return password;
}

int verified(const std::string& password, const std::string& value, AesKeyData* keys) {
  return verify_password(password.data(), static_cast<int>(password.size()), value.data(),
                         static_cast<int>(value.size()), 1, keys);
}

// What was wrong, or null.
const char* tryOne(const Scheme& scheme, AesKeyData* keys) {
  const std::string password = randomPassword(scheme.takesNul);
  char salt[3];
  generate_crypt_salt(salt);
  char out[1024];
  const int length = format_password(scheme.code, salt, keys, password.data(), static_cast<int>(password.size()), out,
                                     static_cast<int>(sizeof out));
  if (length <= 0) return "not formatted";
  const std::string value(out, static_cast<size_t>(length));
  if (check_format(out, static_cast<unsigned>(length)) != scheme.code) return "not recognised";
  if (verified(password, value, keys) != 0) return "not verified";
  // Bytes after a NUL do not count for {SHA}, so a wrong one may be the same there.
  const bool nulBlind = scheme.code == FORMAT_SHA && password.find('\0') != std::string::npos;
  if (!nulBlind && verified(wrongOne(password, scheme), value, keys) == 0) return "a wrong password matched";
  if (scheme.code < FORMAT_QVEIL) return nullptr;
  char* clear = nullptr;
  int clearLength = 0;
  if (unformat_password(value.c_str(), &clear, keys, &clearLength) != 1) return "not reversed";
  const std::string reversed(clear, static_cast<size_t>(clearLength));
  _morva_utils_decode_buffer_free(&clear);
  return reversed == password.substr(0, scheme.counted) ? nullptr : "reversed to something else";
}

long residentPages() {
  long size = 0;
  long resident = 0;
  std::ifstream("/proc/self/statm") >> size >> resident;
  return resident;
}

}  // namespace

int main(int argc, char** argv) {
  const long wanted = argc > 1 ? std::strtol(argv[1], nullptr, 10) : 2000;
  AesKeyData* keys = test::fixedRecord();
  long before = 0;
  for (long i = 0; i < wanted; ++i) {
    if (i == wanted / 10) before = residentPages();  // by then every buffer has had its size
    for (const Scheme& scheme : kSchemes) {
      if (const char* fault = tryOne(scheme, keys)) {
        std::printf("password %ld, scheme %d: %s\n", i, scheme.code, fault);
        return 1;
      }
    }
  }
  std::printf("%ld passwords under %zu schemes; resident pages %ld, at the end %ld\n", wanted,
              sizeof kSchemes / sizeof kSchemes[0], before, residentPages());
  freeAesKeyData(keys);
  return 0;
}
