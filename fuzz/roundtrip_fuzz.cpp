// SPDX-License-Identifier: Apache-2.0
// A value is made under every scheme, in a buffer of exactly the least size: it matches the password that it was made
// of and no other, and opens into it when the scheme is reversible.
#include <strings.h>

#include <algorithm>

#include "fuzz_input.h"
#include "password_schemes.h"

using namespace fuzz;

static unsigned draws = 1;

// In place of the system's, so that an input means the same each time. No byte of a draw is zero.
extern "C" int rand_r(unsigned*) noexcept {
  draws = draws * 1664525U + 1013904223U;
  return static_cast<int>(draws >> 1U | 0x01010101U);
}

namespace {

struct Row {
  int scheme;
  size_t counted;   // bytes of the password that count
  bool endsAtNul;   // nothing behind a NUL counts
  bool readsNul;    // what is behind a NUL does not count as NUL
  size_t verified;  // a longer password cannot be verified
};

constexpr size_t kAll = SIZE_MAX;
constexpr Row kRows[] = {{FORMAT_SHA, kAll, false, false, kAll},  {FORMAT_SSHA, kAll, true, false, kAll},
                         {FORMAT_MD5, kAll, true, false, kAll},   {FORMAT_CRYPT, 8, true, false, kAll},
                         {FORMAT_QVEIL, 46, true, false, kAll},   {FORMAT_AES128, kAll, false, true, 751},
                         {FORMAT_AES192, kAll, false, true, 751}, {FORMAT_AES256, kAll, false, true, 751}};

// {MD5} values are longer than the length that is stated for them.
int leastSize(int scheme, int length) {
  return scheme == FORMAT_MD5 ? 29 : formatted_password_length(scheme, length);
}

bool matches(std::string_view presented, const Block& value) {
  const Block text(presented);
  return verify_password(text.text(), text.length(), value.text(), value.length(), 1, keyRecord()) == 0;
}

void tryOpening(const Row& row, std::string_view counted, const Block& value) {
  char* clear = nullptr;
  int length = -1;
  const bool isOpened = unformat_password(Block::text(value.view()).text(), &clear, keyRecord(), &length) == 1;
  require(isOpened == (row.scheme >= FORMAT_QVEIL));
  require(!isOpened || std::string_view(clear, static_cast<size_t>(length)) == counted);
  _morva_utils_decode_buffer_free(&clear);
}

void tryMatching(const Row& row, std::string_view counted, const Block& value, unsigned seed) {
  const bool canMatch = counted.size() <= row.verified;
  require(matches(counted, value) == canMatch);
  std::string other(counted);
  if (counted.size() < row.counted) require(!matches(other + 'x', value));
  const size_t read = row.readsNul ? other.size() : strnlen(other.data(), other.size());
  if (read == 0) return;
  char& changed = other[seed / 8 % read];
  changed = static_cast<char>(changed ^ (1 << seed % 7));
  require(!matches(other, value));
  for (char* c = value.text(); *c != '}'; ++c) *c = static_cast<char>(seed % 2 == 0 ? tolower(*c) : toupper(*c));
  require(matches(counted, value) == canMatch);
}

void tryScheme(const Row& row, char* salt, const Block& clear, unsigned seed) {
  const Block value(static_cast<size_t>(leastSize(row.scheme, clear.length())));
  const int made =
      format_password(row.scheme, salt, keyRecord(), clear.text(), clear.length(), value.text(), value.length());
  if (row.scheme == FORMAT_SHA && clear.length() >= 5 && strncasecmp(clear.text(), "{SHA}", 5) == 0) {
    require(made == (clear.length() == 33 ? 0 : 33));  // a digest, not a password
    return;
  }
  require(made == value.length());
  std::string_view counted = clear.view();
  if (row.endsAtNul) counted = counted.substr(0, counted.find('\0'));
  counted = counted.substr(0, row.counted);
  tryOpening(row, counted, value);
  tryMatching(row, counted, value, seed);
}

// Any scheme code and any size that the contract allows.
void tryAnything(Input input) {
  const int scheme = input.byte() % 2 == 0 ? static_cast<int>(input.byte()) : input.number<int>();
  const size_t size = input.byte();
  const Block salt = Block::text(input.take(2));
  const Block clear(input.rest());
  const Block out(scheme == FORMAT_MD5 ? std::max(size, size_t{29}) : size);
  for (AesKeyData* keys : {keyRecord(), static_cast<AesKeyData*>(nullptr)}) {
    const int made = format_password(scheme, salt.text(), keys, clear.text(), clear.length(), out.text(), out.length());
    require(made >= 0 && made <= out.length());
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  Input input(data, size);
  draws = 1;
  tryAnything(input);
  const Row& row = kRows[input.byte() % std::size(kRows)];
  const unsigned seed = input.number<uint16_t>();
  const Block salt =
      Block::text(std::string(Block::text(input.take(2)).text()) + "..");  // one character is shown twice
  tryScheme(row, salt.text(), Block(input.rest()), seed);
  return 0;
}
