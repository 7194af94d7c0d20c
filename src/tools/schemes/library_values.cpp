// SPDX-License-Identifier: Apache-2.0
// Payload checks, and making, checking and opening values with the library.
#include "schemes/library_values.h"

#include <algorithm>
#include <cstring>

#include "base/random.h"
#include "base/text.h"
#include "password_schemes.h"
#include "schemes/foreign_values.h"
#include "schemes/key_record.h"
#include "schemes/schemes.h"

namespace tool {
namespace {

constexpr size_t kLeastOutBytes = 1024;
constexpr char kCryptCharacters[] = "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
constexpr Status kNoMatchStatus{kNoMatch, "the password does not match"};

void drawCryptSalt(char (&salt)[3]) {
  char random[2];
  drawRandom(random, sizeof random);
  salt[0] = kCryptCharacters[static_cast<unsigned char>(random[0]) & 63U];
  salt[1] = kCryptCharacters[static_cast<unsigned char>(random[1]) & 63U];
  salt[2] = '\0';
}

Status makeWithSalt(const Scheme& scheme, char* salt, const KeyRecord& key, const Secret& password, Secret& out) {
  const int clearBytes = static_cast<int>(password.size());
  const int needed = formatted_password_length(scheme.code, clearBytes);
  if (needed < 0) return {kInternal, "the length of the value is not known"};
  out.clear();
  out.resize(std::max(kLeastOutBytes, static_cast<size_t>(needed) + 64));
  const int written = format_password(scheme.code, salt, key.get(), password.c_str(), clearBytes, out.data(),
                                      static_cast<int>(out.size()));
  out.resize(static_cast<size_t>(std::max(written, 0)));
  return written > 0 ? Status{} : Status{kInternal, "the value could not be made"};
}

}  // namespace

const char* base64Problem(const PayloadRule& rule, std::string_view payload) {
  const long bytes = base64Bytes(payload);
  if (bytes < 0) return "the payload is not base64 text";
  return bytes >= rule.least && bytes <= rule.most && bytes % rule.step == 0 ? nullptr : rule.text;
}

const char* cryptProblem(const PayloadRule& rule, std::string_view payload) {
  const bool ours = payload.size() == 13 && payload.find_first_not_of(kCryptCharacters) == std::string_view::npos;
  return ours ? nullptr : rule.text;
}

const char* maskedProblem(const PayloadRule& rule, std::string_view payload) {
  if (payload.size() < 4 || payload.substr(0, 2) != ">1" || payload.back() != '<') {
    return "the payload is not wrapped in \">1\" and \"<\"";
  }
  Secret copy(payload);  // decoding writes to its input
  unsigned char* clear = nullptr;
  int clearBytes = 0;
  const int code = _morva_utils_decode_binary(copy.data(), &clear, &clearBytes);
  const bool decoded = code == LDAPPW_SUCCESS && clear != nullptr;
  _morva_utils_decode_binary_free(&clear);
  return decoded ? nullptr : rule.text;
}

const char* shaPasswordProblem(std::string_view password) {
  if (!beginsWithName(password, "{SHA}")) return nullptr;
  return "a password that begins with {SHA} would be taken for a value by this scheme";
}

Status makeClear(const Scheme&, const KeyRecord&, const Costs&, const Secret& password, Secret& out) {
  out.clear();
  out.append(password.view());
  return {};
}

Status makeByLibrary(const Scheme& scheme, const KeyRecord& key, const Costs&, const Secret& password, Secret& out) {
  return makeWithSalt(scheme, nullptr, key, password, out);
}

Status makeSsha(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password, Secret& out) {
  constexpr std::uint32_t kLibrarySaltBytes = 20;
  const bool usual = costs.saltBytes == kLibrarySaltBytes;
  return (usual ? makeByLibrary : makeSalted)(scheme, key, costs, password, out);
}

Status makeCrypt(const Scheme& scheme, const KeyRecord& key, const Costs&, const Secret& password, Secret& out) {
  char salt[3];
  drawCryptSalt(salt);
  return makeWithSalt(scheme, salt, key, password, out);
}

Status openClear(const StoredValue& value, const KeyRecord&, Secret& out) {
  out.append(value.whole().view());
  return {};
}

Status openByLibrary(const StoredValue& value, const KeyRecord& key, Secret& out) {
  char* clear = nullptr;
  int clearBytes = 0;
  const bool opened = unformat_password(value.whole().c_str(), &clear, key.get(), &clearBytes) == 1 && clear != nullptr;
  if (opened) {
    const auto bytes = static_cast<size_t>(std::max(clearBytes, 0));
    out.append({clear, bytes});
    explicit_bzero(clear, bytes);  // the library's release looks no further than the first NUL
  }
  _morva_utils_decode_buffer_free(&clear);
  if (opened) return {};
  if (value.scheme().needsKey()) return {kBadKey, "the key does not open the value"};
  return {kBadValue, "the value does not open"};
}

Status checkByLibrary(const StoredValue& value, const KeyRecord& key, const Secret& password) {
  const Secret& stored = value.whole();
  const int code = verify_password(password.c_str(), static_cast<int>(password.size()), stored.c_str(),
                                   static_cast<int>(stored.size()), 1, key.get());
  if (code == LDAPPW_NO_MEMORY) return {kInternal, "out of memory"};
  return code == LDAPPW_SUCCESS ? Status{} : kNoMatchStatus;
}

Status checkByOpening(const StoredValue& value, const KeyRecord& key, const Secret& password) {
  Secret clear;
  const Status opened = openByLibrary(value, key, clear);
  if (!opened.ok()) return opened;
  return equalBytes(clear.view(), password.view()) ? Status{} : kNoMatchStatus;
}

}  // namespace tool
