// SPDX-License-Identifier: Apache-2.0
// The masked encoding against a slow model of its own: records taken apart and records put together, sound and hostile.
#include <gtest/gtest.h>

#include <functional>
#include <random>

#include "masking_model.h"
#include "support.h"

namespace {

using test::AllocationWatch;
using test::bytesOf;
using test::Fields;
using test::modelArea;
using test::randomBytes;
using test::recordOf;
using test::Replaced;
using test::textOf;
using test::unmasked;

struct Result {
  int rc;
  bool null;
  int length;
  std::string data;
  std::string left;  // the caller's text afterwards
  bool terminated = false;
};

Result decoded(std::string text) {
  unsigned char* data = nullptr;
  int length = 0;
  const int rc = _morva_utils_decode_binary(text.data(), &data, &length);
  Result result{rc, data == nullptr, length, "", text.c_str()};
  if (data != nullptr) {
    result.data.assign(reinterpret_cast<char*>(data), static_cast<size_t>(length));
    const bool wrapped = result.left.size() < text.size();  // clear text counts its terminator
    result.terminated = data[wrapped ? length : length - 1] == 0;
  }
  _morva_utils_decode_binary_free(&data);
  EXPECT_EQ(data, nullptr);
  return result;
}

std::string encoded(const std::string& data) {
  char* text = nullptr;
  EXPECT_EQ(_morva_utils_encode_binary(bytesOf(data), static_cast<int>(data.size()), &text), 0);
  const std::string copy = text != nullptr ? text : "";
  _morva_utils_encode_binary_free(&text);
  return copy;
}

TEST(Masking, TextsAreMadeAsTheModelTakesThemApart) {
  std::mt19937 random(1);
  std::vector<size_t> lengths = {4096, 65535, 65537};
  for (size_t length = 0; length <= 300; ++length) lengths.push_back(length);
  for (const size_t length : lengths) {
    SCOPED_TRACE(length);
    const std::string data = randomBytes(random, length);
    const std::string text = encoded(data);
    Fields fields;
    EXPECT_EQ(unmasked(text, fields), data);
    EXPECT_EQ(fields.length, length);
    EXPECT_EQ(fields.width, length <= 12 ? 1U : length <= 24 ? 2U : 4U);
    EXPECT_EQ(fields.selector, 11U);
    EXPECT_EQ(fields.blockSelector, 11U);
    EXPECT_EQ(fields.constant, 39U);
    EXPECT_TRUE(fields.key >= 0 && fields.key < 77 && fields.blockKey >= 0 && fields.blockKey < 77);
    const int size = _morva_utils_getEncodedSize(static_cast<int>(length));
    EXPECT_EQ(static_cast<size_t>(size), (modelArea(length) + test::kPacket + 2) / 3 * 4 + 5);
    EXPECT_EQ(text.size() + 1, static_cast<size_t>(size));
    const Result back = decoded(text);
    EXPECT_EQ(back.rc, 0);
    EXPECT_EQ(back.data, data);
    EXPECT_TRUE(back.terminated);
  }
}

TEST(Masking, TextsKeepTheirSizes) {
  for (const auto& [characters, size] : {std::pair{0, 164}, {47, 164}, {48, 208}, {63, 208}}) {
    SCOPED_TRACE(characters);
    const std::string clear(static_cast<size_t>(characters), 'x');
    char* text = nullptr;
    ASSERT_EQ(_morva_utils_encode_buffer(clear.c_str(), &text), 0);
    EXPECT_EQ(static_cast<int>(std::strlen(text)), size);
    char* back = nullptr;
    EXPECT_EQ(_morva_utils_decode_buffer(text, &back), 0);
    EXPECT_EQ(back, clear);
    _morva_utils_decode_buffer_free(&back);
    _morva_utils_encode_buffer_free(&text);
  }
  EXPECT_EQ(_morva_utils_getEncodedSize(0), 165);
  EXPECT_EQ(_morva_utils_getEncodedSize(48), 165);
}

TEST(Masking, DecodesEveryWrappingAndClearText) {
  static const struct {
    const char* text;
    int rc;
    const char* data;  // null: no result
    int length;
    const char* left;
  } rows[] = {
      {"", 0, "", 1, ""},
      {"plain", 0, "plain", 6, "plain"},
      {">", 0, ">", 2, ">"},
      {"<", 0, "<", 2, "<"},
      {">1abc", 0, ">1abc", 6, ">1abc"},
      {"1abc<", 0, "1abc<", 6, "1abc<"},
      {"><", 0, "", 0, ">"},  // wrapped texts lose their last character
      {">xQUJD<", 0, "ABC", 3, ">xQUJD"},
      {">2QUJD<", 0, "ABC", 3, ">2QUJD"},
      {">0<", 0, "", 0, ">0"},
      {">0Fl0ECgFC<", 0, "secret", 6, ">0Fl0ECgFC"},
      {">1<", 0, nullptr, 0, ">1"},
      {">1?QUJD<", 0, nullptr, 0, ">1?QUJD"},
      {">10<", 89, nullptr, 0, ">10"},
      {">10QUJD<", 89, nullptr, 0, ">10QUJD"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.text);
    const Result result = decoded(row.text);
    EXPECT_EQ(result.rc, row.rc);
    EXPECT_EQ(result.null, row.data == nullptr);
    if (row.data != nullptr) {
      EXPECT_STREQ(result.data.c_str(), row.data);
    }
    EXPECT_EQ(result.length, row.length);
    EXPECT_EQ(result.left, row.left);
  }
}

TEST(Masking, DecodesWhateverKeyAlphabetAndSelectorTheRecordNames) {
  const std::string data = "thirty bytes of data, as it is";
  for (int key = -128; key < 128; ++key) {
    for (const unsigned selector : {1U, 7U, 11U}) {
      SCOPED_TRACE(testing::Message() << "key " << key << " selector " << selector);
      Fields fields{static_cast<unsigned>(data.size())};
      fields.selector = selector;
      fields.key = key;
      fields.blockSelector = (key & 1) != 0 ? selector : 11;
      fields.blockKey = -1 - key;
      const Result result = decoded(textOf(recordOf(data, fields), static_cast<size_t>(key + 128) % 16));
      EXPECT_EQ(result.rc, 0);
      EXPECT_EQ(result.data, data);
    }
  }
}

TEST(Masking, RefusesRecordsThatDoNotHoldTogether) {
  static const struct {
    const char* name;
    int rc;
    void (*change)(Fields&);
    void (*cut)(std::string& record);
  } rows[] = {
      {"sound", 0, [](Fields&) {}, nullptr},
      {"all that width 4 holds", 0, [](Fields& f) { f.length = 48; }, nullptr},
      {"one more than width 4 holds", 89, [](Fields& f) { f.length = 49; }, nullptr},
      {"one more than width 2 holds", 89, [](Fields& f) { f.length = 25, f.width = 2; }, nullptr},
      {"one more than width 1 holds", 89, [](Fields& f) { f.length = 13, f.width = 1; }, nullptr},
      {"the largest length", 89, [](Fields& f) { f.length = 0xffffff; }, nullptr},
      {"width 0", 89, [](Fields& f) { f.width = 0x40; }, nullptr},
      {"width 3", 89, [](Fields& f) { f.width = 3; }, nullptr},
      {"width 8", 89, [](Fields& f) { f.width = 8; }, nullptr},
      {"width 63", 89, [](Fields& f) { f.width = 63; }, nullptr},
      {"selector 0", 89, [](Fields& f) { f.selector = 0; }, nullptr},
      {"selector 2", 89, [](Fields& f) { f.selector = 2; }, nullptr},
      {"selector 15", 89, [](Fields& f) { f.selector = 15; }, nullptr},
      {"block selector 0", 89, [](Fields& f) { f.blockSelector = 0; }, nullptr},
      {"block selector 10", 89, [](Fields& f) { f.blockSelector = 10; }, nullptr},
      {"a byte short", 89, [](Fields&) {}, [](std::string& r) { r.pop_back(); }},
      {"a byte long", 89, [](Fields&) {}, [](std::string& r) { r += 'x'; }},
      {"no data behind the packet", 89, [](Fields&) {}, [](std::string& r) { r.resize(71); }},
      {"a cut packet", 89, [](Fields&) {}, [](std::string& r) { r.resize(64); }},
      {"room for less than the length", 89, [](Fields& f) { f.length = 32; }, [](std::string& r) { r.resize(80); }},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    Fields fields{10};
    row.change(fields);
    std::string record = recordOf("", fields);
    if (row.cut != nullptr) row.cut(record);
    const Result result = decoded(textOf(record));
    EXPECT_EQ(result.rc, row.rc);
    EXPECT_EQ(result.null, row.rc != 0);
  }
}

TEST(Masking, SurvivesDamagedTexts) {
  std::mt19937 random(2);
  const std::string texts[] = {encoded("a"), encoded("some text of twenty"), encoded(std::string(100, 'x'))};
  for (int round = 0; round < 20000; ++round) {
    std::string text = texts[random() % 3];
    for (size_t n = random() % 4; n > 0; --n) text[random() % text.size()] = static_cast<char>(random());
    if (random() % 4 == 0) text.erase(random() % text.size(), random() % 40);
    if (random() % 4 == 0) text.insert(random() % (text.size() + 1), randomBytes(random, random() % 8));
    const Result result = decoded(text.c_str());
    ASSERT_TRUE(result.rc == 0 || result.rc == 89) << result.rc;
    ASSERT_TRUE(result.rc == 0 || result.null);
  }
}

TEST(Masking, EncodesWithTheSelectorAskedFor) {
  for (const int selector : {1, 7, 11}) {
    SCOPED_TRACE(selector);
    const Replaced<int> chosen(encryptionType, selector);
    const std::string text = encoded("some data");
    Fields fields;
    if (selector != 7) {
      EXPECT_EQ(unmasked(text, fields), "some data");
    }
    if (selector != 7) {
      EXPECT_EQ(fields.selector, static_cast<unsigned>(selector));
    }
    if (selector != 7) {
      EXPECT_EQ(decoded(text).data, "some data");
    }
    if (selector == 7) {
      EXPECT_NE(decoded(text).data, "some data");  // the reading side has the reduced schedule
    }
    if (selector == 1) {
      EXPECT_EQ(fields.key & 0xe7, 0);
    }
  }
  for (const int selector : {0, 2, 12, -1}) {
    const Replaced<int> chosen(encryptionType, selector);
    char* text = nullptr;
    EXPECT_EQ(_morva_utils_encode_buffer("x", &text), 89);
    EXPECT_EQ(text, nullptr);
  }
}

TEST(Masking, RefusesArgumentsAndLengthsThatItCannotState) {
  unsigned char byte = 0;
  char text[] = "x";
  char* out = nullptr;
  unsigned char* data = nullptr;
  int length = 0;
  EXPECT_EQ(_morva_utils_encode_buffer(nullptr, &out), 1);
  EXPECT_EQ(_morva_utils_encode_buffer("x", nullptr), 1);
  EXPECT_EQ(_morva_utils_encode_binary(nullptr, 1, &out), 1);
  EXPECT_EQ(_morva_utils_encode_binary(&byte, 1, nullptr), 1);
  EXPECT_EQ(_morva_utils_encode_binary(&byte, -1, &out), 80);
  EXPECT_EQ(_morva_utils_encode_binary(&byte, 16777216, &out), 80);
  EXPECT_EQ(_morva_utils_decode_buffer(nullptr, &out), 1);
  EXPECT_EQ(_morva_utils_decode_buffer(text, nullptr), 1);
  EXPECT_EQ(_morva_utils_decode_binary(nullptr, &data, &length), 1);
  EXPECT_EQ(_morva_utils_decode_binary(text, nullptr, &length), 1);
  EXPECT_EQ(_morva_utils_decode_binary(text, &data, nullptr), 1);
  EXPECT_EQ(out, nullptr);
  EXPECT_EQ(data, nullptr);
  EXPECT_EQ(_morva_utils_getEncodedSize(-1), 0);
  EXPECT_EQ(_morva_utils_getEncodedSize(16777215), 44739281);  // ceil((33554432 + 24) / 3) * 4 + 5
  EXPECT_EQ(_morva_utils_getEncodedSize(16777216), 0);
  _morva_utils_encode_buffer_free(nullptr);
  _morva_utils_decode_buffer_free(&out);
}

TEST(Masking, ReportsEveryFailedAllocation) {
  const std::string sound = textOf(recordOf("", Fields{10}));
  const std::function<int(char**)> calls[] = {
      [](char** out) { return _morva_utils_encode_buffer("text", out); },
      [&](char** out) { return _morva_utils_decode_buffer(std::string(sound).data(), out); },
      [](char** out) { return _morva_utils_decode_buffer(std::string(">0QUJD<").data(), out); },
      [](char** out) { return _morva_utils_decode_buffer(std::string("clear").data(), out); },
  };
  for (const auto& call : calls) {
    char* out = nullptr;
    long failing = 0;
    for (int rc = 90; rc != 0; ++failing) {
      const AllocationWatch watch(failing);
      rc = call(&out);
      ASSERT_EQ(rc, watch.count() > failing ? 90 : 0);
      ASSERT_EQ(out == nullptr, rc != 0);
    }
    EXPECT_GT(failing, 1);
    free(out);
  }
}

}  // namespace
