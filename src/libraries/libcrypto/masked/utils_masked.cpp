// SPDX-License-Identifier: Apache-2.0
// The masked encoding: data scattered over random background, enciphered, and written as text over one of sixteen
// alphabets, with a control packet inside that states how to undo it.
#include "encoding_utils.h"

#include <climits>
#include <cstring>
#include <ctime>

#include "crypt/crypto_simple.h"
#include "masked/utils_masked_bits.h"
#include "masked/utils_masked_cipher.h"
#include "masked/utils_masked_tables.h"
#include "support/owners.h"
#include "support/utils_base64.h"

namespace ldappw::masking {
namespace {

constexpr unsigned encodingMax = sizeof encodings / sizeof encodings[0] - 1;
constexpr int kLargestLength = 0xffffff;  // the packet states a length in three bytes

// The control packet, without the two characters of it that the text shows in clear. From kBlockAt on it is enciphered.
constexpr size_t kPacketBytes = 24;
constexpr size_t kBlockKeyAt = 10;
constexpr size_t kBlockSelectorAt = 11;
constexpr size_t kBlockAt = 16;
constexpr size_t kSelectorAt = 16;
constexpr size_t kKeyAt = 17;
constexpr size_t kConstantAt = 18;
constexpr size_t kWidthAt = 19;
constexpr unsigned char kBlockSelectorMask = 0xcc;
constexpr unsigned char kSelectorMask = 0x56;
constexpr unsigned char kConstantMask = 0x3f;
constexpr unsigned char kWidthMask = 0x3f;
constexpr unsigned kConstant = 39;
static_assert(kPacketBytes - kBlockAt == kCipherBlock);

// The record: the packet lies behind the first data bytes. While it is worked on, the packet comes first.
constexpr size_t kDataBefore = 47;
constexpr size_t kFixedRecord = kDataBefore + kPacketBytes;
constexpr size_t kUsualRecord = 256;  // passwords need no allocation for theirs

constexpr unsigned kLengthCursor = 4;  // where the scattering of the length enters the pattern tables

uint64_t findBinaryDataBufferSize(uint64_t n) noexcept {
  return 2 * n < 97 ? 96 : 96 + (2 * n - 96 + 31) / 32 * 32;
}

unsigned widthFor(size_t length, size_t size) noexcept {
  unsigned width = 1;
  while (width < 4 && 8 / width * length > size) width *= 2;
  return width;
}

const Encoding& drawnEncoding() noexcept {
  auto seed = static_cast<unsigned>(std::clock());
  return encodings[static_cast<unsigned>(rand_r(&seed)) % encodingMax];
}

// A length's lowest byte is scattered over two bytes of the packet, the others over eight more, with the patterns of
// other widths but one cursor.
void scatterLength(unsigned char* packet, size_t length) noexcept {
  const unsigned char bytes[3] = {static_cast<unsigned char>(length), static_cast<unsigned char>(length >> 8U),
                                  static_cast<unsigned char>(length >> 16U)};
  const Cursor cursor = bitScatter(bytes, 1, packet, 4, kLengthCursor);
  bitScatter(bytes + 1, 2, packet + 2, 2, cursor);
}

size_t gatheredLength(const unsigned char* packet) noexcept {
  unsigned char bytes[3];
  const Cursor cursor = bitGather(packet, bytes, 1, 4, kLengthCursor);
  bitGather(packet + 2, bytes + 1, 2, 2, cursor);
  return size_t{bytes[0]} | size_t{bytes[1]} << 8U | size_t{bytes[2]} << 16U;
}

void write(unsigned char* packet, size_t at, unsigned value, unsigned char mask) noexcept {
  packet[at] = expandOnBitPattern(value, packet[at], mask);
}

// Masks the data into a packet and the area of so many bytes behind it.
void mask(const unsigned char* data, size_t length, unsigned selector, unsigned char* packet, size_t size) noexcept {
  unsigned char* area = packet + kPacketBytes;
  setBackground(packet, kPacketBytes);
  setBackground(area, size);
  const unsigned width = widthFor(length, size);
  bitScatter(data, length, area, width);
  write(packet, kWidthAt, width, kWidthMask);
  write(packet, kConstantAt, kConstant, kConstantMask);
  write(packet, kSelectorAt, selector, kSelectorMask);
  RecordCipher cipher;
  cipher.encryptData(area, size, selector, packet[kKeyAt]);
  write(packet, kBlockSelectorAt, selector, kBlockSelectorMask);
  cipher.encryptData(packet + kBlockAt, kCipherBlock, selector, packet[kBlockKeyAt]);
  scatterLength(packet, length);
}

// Moves a packet from before the area to its place in the record, and back.
void movePacketIn(unsigned char* record) noexcept {
  unsigned char packet[kPacketBytes];
  std::memcpy(packet, record, kPacketBytes);
  std::memmove(record, record + kPacketBytes, kDataBefore);
  std::memcpy(record + kDataBefore, packet, kPacketBytes);
}
void movePacketOut(unsigned char* record) noexcept {
  unsigned char packet[kPacketBytes];
  std::memcpy(packet, record + kDataBefore, kPacketBytes);
  std::memmove(record + kPacketBytes, record, kDataBefore);
  std::memcpy(record, packet, kPacketBytes);
}

int wrapped(const unsigned char* record, size_t bytes, const Encoding& encoding, char** out) noexcept {
  const size_t characters = (bytes + 2) / 3 * 4;
  char* text = newBytes<char>(characters + 5);
  if (text == nullptr) return LDAPPW_NO_MEMORY;
  text[0] = '>';
  text[1] = '1';
  text[2] = encoding.identifier[0];
  encodeBytes(record, bytes, encoding.alphabet, text + 3);
  text[3 + characters] = '<';
  text[4 + characters] = '\0';
  *out = text;
  return LDAPPW_SUCCESS;
}

int encode(const unsigned char* data, size_t length, char** out) noexcept {
  const auto selector = static_cast<unsigned>(encryptionType);
  if (!isSelector(selector)) return LDAPPW_NOT_SUPPORTED;
  const Encoding& encoding = drawnEncoding();
  const auto size = static_cast<size_t>(findBinaryDataBufferSize(length));
  SecretBytes<kUsualRecord> record(kPacketBytes + size);
  if (!record) return LDAPPW_NO_MEMORY;
  mask(data, length, selector, record.get(), size);
  movePacketIn(record.get());
  return wrapped(record.get(), record.size(), encoding, out);
}

// What a decoder makes: bytes with a NUL behind them, and how many it says they are.
struct Decoded {
  unsigned char* data = nullptr;
  size_t length = 0;
};

int gathered(const unsigned char* area, size_t areaBytes, size_t length, unsigned width, Decoded& out) noexcept {
  if (length > areaBytes / (8 / width)) return LDAPPW_NOT_SUPPORTED;
  out.data = zeroedBytes<unsigned char>(length + 1);
  if (out.data == nullptr) return LDAPPW_NO_MEMORY;
  out.length = length;
  bitGather(area, out.data, length, width);
  return LDAPPW_SUCCESS;
}

// Undoes mask on a record, which it uses as its work area.
int unmask(unsigned char* record, size_t bytes, Decoded& out) noexcept {
  if (bytes < kFixedRecord || (bytes - kPacketBytes) % kCipherBlock != 0) return LDAPPW_NOT_SUPPORTED;
  movePacketOut(record);
  unsigned char* packet = record;
  unsigned char* area = record + kPacketBytes;
  const size_t areaBytes = bytes - kPacketBytes;

  const unsigned blockSelector = collapseOnBitPattern(packet[kBlockSelectorAt], kBlockSelectorMask);
  if (!isSelector(blockSelector)) return LDAPPW_NOT_SUPPORTED;
  RecordCipher cipher;
  cipher.decryptData(packet + kBlockAt, kCipherBlock, blockSelector, packet[kBlockKeyAt]);
  const unsigned selector = collapseOnBitPattern(packet[kSelectorAt], kSelectorMask);
  const unsigned width = collapseOnBitPattern(packet[kWidthAt], kWidthMask);
  if (!isSelector(selector) || !isWidth(width)) return LDAPPW_NOT_SUPPORTED;
  cipher.decryptData(area, areaBytes, selector, packet[kKeyAt]);
  return gathered(area, areaBytes, gatheredLength(packet), width, out);
}

const char* alphabetOf(char identifier) noexcept {
  for (const Encoding* entry = encodings; entry->alphabet != nullptr; ++entry) {
    if (entry->identifier[0] == identifier) return entry->alphabet;
  }
  return nullptr;
}

// The form ">1" + identifier + record + "<"; what comes in begins with the identifier.
int decodeMasked(const char* text, Decoded& out) noexcept {
  const char* alphabet = *text == '\0' ? nullptr : alphabetOf(*text);
  if (alphabet == nullptr) return LDAPPW_SUCCESS;
  const size_t characters = std::strlen(text + 1);
  SecretBytes<kUsualRecord> record(decodedRoom(characters));
  if (!record) return LDAPPW_NO_MEMORY;
  return unmask(record.get(), decodeText(text + 1, characters, alphabet, record.get()).bytes, out);
}

// The form ">" + any other character + base64 + "<". Padding inside leaves bytes behind the stated end: they go.
int _noencode_decode_binary(const char* text, Decoded& out) noexcept {
  unsigned bytes = 0;
  out.data = base64ToBinaryBlob(text, &bytes);
  if (out.data == nullptr) return LDAPPW_NO_MEMORY;
  out.data[bytes] = '\0';
  out.length = bytes;
  return LDAPPW_SUCCESS;
}

// The older form ">0" + base64 of simpleCrypt output + "<".
int decodeSimple(const char* text, Decoded& out) noexcept {
  const int rc = _noencode_decode_binary(text, out);
  if (rc == LDAPPW_SUCCESS) simpleCryptInPlace(out.data, out.length);
  return rc;
}

// Clear text stands for itself; the NUL counts, as the encoder of texts masks it too.
int copied(const char* text, size_t length, Decoded& out) noexcept {
  out.data = newBytes<unsigned char>(length + 1);
  if (out.data == nullptr) return LDAPPW_NO_MEMORY;
  std::memcpy(out.data, text, length + 1);
  out.length = length + 1;
  return LDAPPW_SUCCESS;
}

int decode(char* text, Decoded& out) noexcept {
  const size_t length = std::strlen(text);
  if (length >= INT_MAX) return LDAPPW_OTHER;  // no result is longer than its text and a NUL
  if (length < 2 || text[0] != '>' || text[length - 1] != '<') return copied(text, length, out);
  const char form = text[1];
  text[length - 1] = '\0';  // in the caller's text, which callers know to have lost its "<" (Masking.DecodesOrRefuses)
  const char* payload = length > 2 ? text + 2 : text + 1;
  if (form == '1') return decodeMasked(payload, out);
  return form == '0' ? decodeSimple(payload, out) : _noencode_decode_binary(payload, out);
}

// Bytes behind a first NUL are not wiped: only the caller knows of them.
void release(char** result) noexcept {
  if (result == nullptr) return;
  wipeAndFreeText(*result);
  *result = nullptr;
}

}  // namespace
}  // namespace ldappw::masking

using namespace ldappw;

extern "C" {

// Documented in encoding_utils.h.

int encryptionType = masking::kDes;

int _morva_utils_encode_buffer(const char* text, char** out) noexcept {
  if (text == nullptr || out == nullptr) return LDAPPW_OPERATIONS_ERROR;
  const size_t length = std::strlen(text) + 1;
  if (length > masking::kLargestLength) return LDAPPW_OTHER;
  return masking::encode(reinterpret_cast<const unsigned char*>(text), length, out);
}

int _morva_utils_encode_binary(const unsigned char* data, int length, char** out) noexcept {
  if (out == nullptr || (data == nullptr && length != 0)) return LDAPPW_OPERATIONS_ERROR;
  if (length < 0 || length > masking::kLargestLength) return LDAPPW_OTHER;
  return masking::encode(data, static_cast<size_t>(length), out);
}

int _morva_utils_decode_buffer(char* text, char** out) noexcept {
  int length = 0;
  unsigned char* data = nullptr;
  if (out == nullptr) return LDAPPW_OPERATIONS_ERROR;
  const int rc = _morva_utils_decode_binary(text, &data, &length);
  *out = reinterpret_cast<char*>(data);
  return rc;
}

int _morva_utils_decode_binary(char* text, unsigned char** out, int* outLength) noexcept {
  if (text == nullptr || out == nullptr || outLength == nullptr) return LDAPPW_OPERATIONS_ERROR;
  *out = nullptr;
  *outLength = 0;
  masking::Decoded decoded;
  const int rc = masking::decode(text, decoded);
  if (rc != LDAPPW_SUCCESS) return rc;
  *out = decoded.data;
  *outLength = static_cast<int>(decoded.length);
  return LDAPPW_SUCCESS;
}

void _morva_utils_encode_buffer_free(char** result) noexcept {
  masking::release(result);
}
void _morva_utils_encode_binary_free(char** result) noexcept {
  masking::release(result);
}
void _morva_utils_decode_buffer_free(char** result) noexcept {
  masking::release(result);
}
void _morva_utils_decode_binary_free(char** result) noexcept {
  masking::release(result);
}

int _morva_utils_getEncodedSize(int length) noexcept {
  const uint64_t data = length > 0 ? static_cast<uint64_t>(length) : 0;
  const uint64_t bytes = masking::findBinaryDataBufferSize(data) + masking::kPacketBytes;
  const uint64_t size = (bytes + 2) / 3 * 4 + 5;
  return size <= INT_MAX ? static_cast<int>(size) : 0;
}

}  // extern "C"
