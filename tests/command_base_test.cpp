// SPDX-License-Identifier: Apache-2.0
// The lower layers of the command: lines, compressed input, text, and the limits of what a check may cost.
#include <zlib.h>
#include <zstd.h>

#include <ctime>

#include "base/input.h"
#include "base/text.h"
#include "command.h"
#include "schemes/foreign_payloads.h"

using namespace std::string_literals;
using namespace test;
using tool::Failure;
using tool::Secret;

namespace {

const std::string kLong(200000, 'c');

struct Lines {
  std::string input;
  char end;
  std::vector<std::string> lines;
  size_t buffered;  // so many are there whole after the first read
};
const Lines kLines[] = {{"", '\n', {}, 0},
                        {"\n", '\n', {""}, 1},
                        {"a\nb\r\n\nc", '\n', {"a", "b\r", "", "c"}, 3},
                        {"a\n\0b\0"s, '\0', {"a\n", "b"}, 2},
                        {kLong + "\n" + kLong, '\n', {kLong, kLong}, 0}};

TEST(LineReader, SplitsWhateverComesIn) {
  const TempFolder folder;
  for (const Lines& row : kLines) {
    putFile(folder.file("in"), row.input);
    tool::LineReader reader(tool::Input(folder.file("in")), {kLong.size(), "a test"}, row.end);
    EXPECT_FALSE(reader.lineBuffered());
    Secret line;
    for (size_t i = 0; i < row.lines.size(); ++i) {
      ASSERT_TRUE(reader.next(line));
      EXPECT_EQ(line.view(), row.lines[i]);
      const bool ended = i + 1 == row.lines.size() && row.input.back() != row.end;
      EXPECT_EQ(reader.lineBuffered(), i + 1 < row.buffered || ended) << i;
    }
    EXPECT_FALSE(reader.next(line) || reader.next(line));
    EXPECT_TRUE(line.empty() && reader.lineBuffered());
  }
}

// What no line ends is not gathered, wherever the limit lies in what is read at once.
TEST(LineReader, EndsAtItsLimit) {
  const TempFolder folder;
  const std::string path = folder.file("in");
  for (const size_t most : {size_t{0}, size_t{12}, size_t{65535}, size_t{65536}, size_t{150000}}) {
    for (const char* end : {"", "\n", "\nmore"}) {
      putFile(path, "\n" + std::string(most, 'x') + "\n" + std::string(most + 1, 'x') + end);
      tool::LineReader reader(tool::Input(path), {most, "a test"});
      Secret line;
      ASSERT_TRUE(reader.next(line) && reader.next(line));
      EXPECT_EQ(line.size(), most);
      try {
        reader.next(line);
        ADD_FAILURE() << most;
      } catch (const Failure& failure) {
        EXPECT_EQ(failure.what(),
                  path + ", line 3: more than the " + std::to_string(most) + " bytes that a test may have");
      }
    }
  }
  tool::LineReader endless(tool::Input("/dev/zero"), tool::kSeedLine);
  Secret line;
  EXPECT_THROW(endless.next(line), Failure);
}

std::string gzip(const std::string& bytes) {
  z_stream stream{};
  deflateInit2(&stream, 9, Z_DEFLATED, 16 + MAX_WBITS, 8, Z_DEFAULT_STRATEGY);
  std::string packed(deflateBound(&stream, static_cast<unsigned long>(bytes.size())) + 64, '\0');
  stream.next_in = const_cast<unsigned char*>(bytesOf(bytes));
  stream.avail_in = static_cast<unsigned>(bytes.size());
  stream.next_out = bytesOf(packed);
  stream.avail_out = static_cast<unsigned>(packed.size());
  deflate(&stream, Z_FINISH);
  packed.resize(stream.total_out);
  deflateEnd(&stream);
  return packed;
}

std::string zstd(const std::string& bytes) {
  std::string packed(ZSTD_compressBound(bytes.size()), '\0');
  packed.resize(ZSTD_compress(packed.data(), packed.size(), bytes.data(), bytes.size(), 3));
  return packed;
}

// The content of a file as it is read, or what is wrong with it.
std::string readFrom(const std::string& content) {
  const TempFolder folder;
  putFile(folder.file("in"), content);
  try {
    tool::Input input(folder.file("in"));
    input.requireText();
    Secret text;
    while (input.more(text, 65536)) {
    }
    return std::string(text.view());
  } catch (const Failure& failure) {
    return std::string(failure.what()).substr(folder.file("in").size());
  }
}

// In two pieces, as log rotation appends them.
TEST(Decompression, AnyLengthAndAnyCut) {
  std::string text = "dn: a\n" + kLong + "\n";
  for (int i = 0; i < 30000; ++i) text += std::to_string(i * 7919) + "\n";
  for (const auto& [pack, name, zeros] : {std::tuple{&gzip, "gzip", 512}, std::tuple{&zstd, "zstd", 0}}) {
    const std::string packed = pack(text.substr(0, 150000)) + pack(text.substr(150000));
    EXPECT_TRUE(readFrom(packed + std::string(static_cast<size_t>(zeros), '\0')) == text) << name;
    EXPECT_EQ(readFrom(packed + "rubbish"), ": the "s + name + " data is damaged");
    EXPECT_EQ(readFrom(pack(packed)), " is no LDIF: it seems to be compressed twice");
    const std::string small = pack("dn: a\nuserPassword: secret\n");
    for (size_t bytes = 4; bytes < small.size(); ++bytes) {
      EXPECT_EQ(readFrom(small.substr(0, bytes)), ": the compressed data ends too early") << name << bytes;
    }
  }
}

// A member or frame with nothing in it costs its own bytes, not a buffer.
TEST(Decompression, NothingInAMember) {
  const auto spent = [](const std::string& packed, size_t bytes) {
    const std::clock_t before = std::clock();
    EXPECT_EQ(readFrom(packed).size(), bytes);
    return std::clock() - before + 1;
  };
  for (const auto& pack : {gzip, zstd}) {
    const std::string one = pack("");
    std::string empty;
    for (int i = 0; i < 32768; ++i) empty += one;
    const std::string text(size_t{1} << 22, 'x');
    EXPECT_LE(spent(pack("dn: a\n") + empty + pack("cn: a\n"), 12), 5 * spent(pack(text), text.size()));
  }
}

// What a reader may be shown: well-formed UTF-8 (RFC 3629) as it is but for what is not seen; all else as \xNN.
TEST(Text, Printable) {
  const std::pair<std::string, std::string> rows[] = {
      {"", ""},
      {"a\\ ~", "a\\ ~"},
      {"\x1f\x7f\0"s, "\\x1F\\x7F\\x00"},
      {"\xc2\xa0\xdf\xbf", "\xc2\xa0\xdf\xbf"},
      {"\xc1\xbf\xc0\x80", "\\xC1\\xBF\\xC0\\x80"},  // too long for what they are
      {"\xe0\x9f\xbf\xe0\xa0\x80", "\\xE0\\x9F\\xBF\xe0\xa0\x80"},
      {"\xed\x9f\xbf\xed\xa0\x80", "\xed\x9f\xbf\\xED\\xA0\\x80"},  // a surrogate
      {"\xf0\x8f\xbf\xbf\xf0\x90\x80\x80", "\\xF0\\x8F\\xBF\\xBF\xf0\x90\x80\x80"},
      {"\xf4\x8f\xbf\xbf\xf4\x90\x80\x80", "\xf4\x8f\xbf\xbf\\xF4\\x90\\x80\\x80"},
      {"\xf5\x80\x80\x80\x80\xe2\x82", "\\xF5\\x80\\x80\\x80\\x80\\xE2\\x82"},
      {"\xc3(", "\\xC3("},
  };
  for (const auto& [text, shown] : rows) {
    EXPECT_EQ(tool::printable(text), shown);
    EXPECT_EQ(tool::looksLikeText(text), shown == text) << shown;
  }
  const std::pair<std::string, std::string> unseen[] = {
      {"\xc2\x80\xc2\x9f\xc2\xad", "\\u0080\\u009F\\u00AD"},
      {"a\xd8\x9c\xd8\x9b", "a\\u061C\xd8\x9b"},  // turns the direction
      {"\xe2\x80\x8a\xe2\x80\x8b\xe2\x80\x8f\xe2\x80\x90", "\xe2\x80\x8a\\u200B\\u200F\xe2\x80\x90"},  // no width
      {"\xe2\x80\xa7\xe2\x80\xa8\xe2\x80\xae\xe2\x80\xaf", "\xe2\x80\xa7\\u2028\\u202E\xe2\x80\xaf"},
      {"\xe2\x81\xa6\xe2\x81\xa9\xef\xbb\xbf\xe3\x85\xa4", "\\u2066\\u2069\\uFEFF\\u3164"},
      {"\xf3\xa0\x81\x81\xf3\xa0\xbf\xbf\xf3\xa1\x80\x80", "\\uE0041\\uE0FFF\xf3\xa1\x80\x80"},
  };
  for (const auto& [text, shown] : unseen) EXPECT_EQ(tool::printable(text), shown);
  EXPECT_TRUE(tool::looksLikeText("\xc2\x80\xc2\x9f"));  // of control characters those of one byte count
}

TEST(Text, Base64Bytes) {
  const std::pair<const char*, long> rows[] = {{"", 0},         {"YQ==", 1},  {"YWI=", 2},  {"YWJj", 3},
                                               {"YWJjZA==", 4}, {"YWJ", -1},  {"Y===", -1}, {"====", -1},
                                               {"YW=j", -1},    {"YWJ*", -1}, {"YWJ.", -1}, {"=WJj", -1}};
  for (const auto& [text, bytes] : rows) EXPECT_EQ(tool::base64Bytes(text), bytes) << text;
}

// Values whose check would take longer than some seconds, or more than 1 GiB, and the most that may be.
TEST(Costs, AreBounded) {
  for (const char* value : {"$6$rounds=10000000$s$x", "$5$salt$x", "$md5,rounds=10000000$s$$x", "$sha1$10000000$s$x",
                            "$2b$16$x", "$y$jD5$s$x", "$y$jF5$s$x", "$7$BU..../....s$x"}) {
    EXPECT_TRUE(tool::cryptCostsAreBounded(value)) << value;
  }
  for (const char* value :
       {"$6$rounds=10000001$s$x", "$6$rounds=99999999999$s$x", "$md5,rounds=10000001$s$$x", "$sha1$10000001$s$x",
        "$2b$17$x", "$2y$x$x", "$y$jGz$s$x", "$y$jmT$s$x", "$y$kD5$s$x", "$gy$jzT$s$x", "$7$zU..../....s$x",
        "$7$BU...3/....s$x", "$7$BU....5....s$x", "$7$BU..$x"}) {
    EXPECT_FALSE(tool::cryptCostsAreBounded(value)) << value;
  }
  EXPECT_TRUE(tool::pbkdf2CostsAreBounded(10000000, 32) && tool::pbkdf2CostsAreBounded(20000000, 20));
  EXPECT_FALSE(tool::pbkdf2CostsAreBounded(10000001, 32) || tool::pbkdf2CostsAreBounded(20000001, 20));
  EXPECT_TRUE(tool::argon2CostsAreBounded({1048576, 4, 64}) && tool::argon2CostsAreBounded({65536, 64, 1}));
  EXPECT_FALSE(tool::argon2CostsAreBounded({1048577, 1, 1}) || tool::argon2CostsAreBounded({1048576, 5, 1}));
  EXPECT_FALSE(tool::argon2CostsAreBounded({64, 1, 65}) || tool::argon2CostsAreBounded({65536, 65, 1}));
}

}  // namespace
