// SPDX-License-Identifier: Apache-2.0
// Directory exports: conversions to the byte, the readers that they stand on, and resuming what was stopped.
#include <fcntl.h>
#include <sys/resource.h>

#include <algorithm>
#include <ctime>

#include "command.h"
#include "ldif/key_ring.h"
#include "ldif/record.h"

using namespace test;
using tool::Secret;

namespace {

class Exports : public Folder, public testing::WithParamInterface<Row> {};

TEST_P(Exports, ComeOutAs) {
  const Row& row = GetParam();
  const std::string in = expanded(row[2], names());
  putFile("in", in);
  const Ran result = ran(wordsOf(row[5].empty() ? "ldif --to sha in" : row[5], names()), "secret\n");
  EXPECT_EQ(std::to_string(result.code), row[1]) << result.err;
  if (row[3][0] == '~') {
    EXPECT_TRUE(matches(result.out, "^(" + row[3].substr(1) + ")\n*$")) << result.out;
  } else {
    EXPECT_EQ(result.out, row[3] == "=" ? in : expanded(row[3], names()));
  }
  EXPECT_TRUE(matches(result.err.substr(0, result.err.rfind('\n')), row[4])) << result.err;
  for (const char* name : {"in", "out"}) std::filesystem::remove(name);
}
INSTANTIATE_TEST_SUITE_P(Rows, Exports, testing::ValuesIn(rowsOf("ldif.vec")), nameOf);

constexpr char kText[] =
    "version: 1\n\ndn: a\r\nuserPassword: x\r\n\r\n# c\n\n\n\ndn: b\ncn: c\n\ndn: d\nchangetype: modify\n"
    "replace: userPassword\nuserPassword: y\n-\nadd: userPassword\nuserPassword:: eg\n =\n =\n-\n\nstray: x\n";

// Batches of whole records, however long they are to be.
TEST(RecordReader, CutsBehindBlankLines) {
  const TempFolder folder;
  const std::string text = kText;
  putFile(folder.file("in"), text);
  for (size_t bytes = 1; bytes <= text.size() + 1; ++bytes) {
    tool::Input input(folder.file("in"));
    tool::RecordReader reader(input, bytes);
    tool::Batch batch;
    std::string read;
    for (std::uint64_t number = 0; reader.next(batch); ++number) {
      EXPECT_EQ(batch.number, number);
      EXPECT_EQ(batch.firstLine, 1 + static_cast<std::uint64_t>(std::count(read.begin(), read.end(), '\n')));
      read += batch.text.view();
      EXPECT_TRUE(read == text || matches(read, "\n\r?\n$")) << bytes;
    }
    EXPECT_EQ(read, text) << bytes;
  }
}

// What the walker says of each password: line, dn, form, group and value; then the entries, and what belongs to none.
TEST(RecordWalker, FindsPasswords) {
  const std::vector<std::string> forms{"bytes", "url", "deleted", "authPassword", "broken"};
  const tool::AttributeSet attributes({});
  tool::Batch batch;
  batch.text = Secret(kText);
  tool::RecordWalker walker(batch, attributes);
  std::string seen;
  std::string raw;
  while (walker.next()) {
    raw += walker.line().raw;
    if (!walker.atPassword()) continue;
    seen += std::to_string(walker.lineNumber()) + walker.dn() + (walker.modifies() ? " modifies" : "") + " group " +
            std::to_string(walker.group()) + " " + forms[static_cast<size_t>(walker.password().form)] + " " +
            std::string(walker.password().value.view()) + "\n";
  }
  EXPECT_EQ(raw, kText);
  EXPECT_EQ(seen, "4a group 1 bytes x\n16d modifies group 6 bytes y\n19d modifies group 7 bytes z\n");
  EXPECT_EQ(walker.entries(), 3U);
  EXPECT_EQ(walker.outside(), std::vector<std::uint64_t>{24});
}

TEST(LogicalLines, FoldAt76) {
  for (const size_t bytes : std::vector<size_t>{0, 75, 76, 77, 151, 152, 300}) {
    const std::string text(bytes, 'x');
    Secret folded;
    tool::foldInto(text, "\r\n", folded);
    folded.append("\r\n");
    std::string_view rest = folded.view();
    tool::LogicalLine line;
    ASSERT_TRUE(tool::takeLogicalLine(rest, line) && rest.empty());
    EXPECT_EQ(line.physicalLines, bytes <= 76 ? 1 : 1 + (bytes - 76 + 74) / 75) << bytes;
    Secret unfolded;
    tool::unfold(line, unfolded);
    EXPECT_EQ(unfolded.view(), text);
  }
}

// Which key opens a value, and how surely, from the first on that may.
TEST_F(Folder, KeyRingTellsKeysApart) {
  using Result = tool::KeyRing::Opened::Result;
  const tool::KeyRing ring({"d2", "", "dir", "d3"});
  const size_t none = tool::KeyRing::kNoKey;
  const std::tuple<const char*, size_t, Result, size_t, const char*> rows[] = {
      {"<dir>", 0, Result::kText, 1, "secret"},
      {"<d2>", 0, Result::kText, 0, "secret"},
      {"<d3>", 1, Result::kText, 2, "secret"},
      {"<d2>", 1, Result::kRefused, none, nullptr},
      {"{AES256}6P54Co1SO95zcqBh0rx/RA==", 0, Result::kBytes, 1, "\xff\x30\x30\x30\x30\x31\x31\x33"},
      {"{AES256}BaQx2owQTLzOjfK+1c2O0w==", 0, Result::kAmbiguous, 1, nullptr},
      {"{AES256}BaQx2owQTLzOjfK+1c2O0w==", 1, Result::kBytes, 1, nullptr},
      {"{CLEAR}\xff", 0, Result::kText, none, "\xff"}};
  for (const auto& [text, first, result, key, opened] : rows) {
    const Secret value(expanded(text, names()));
    Secret clear;
    const tool::KeyRing::Opened answer = ring.open(tool::examine(value), first, clear);
    EXPECT_EQ(answer.result, result) << text;
    EXPECT_TRUE(answer.key == key || result == Result::kAmbiguous) << text << answer.key;
    EXPECT_TRUE(opened == nullptr || clear.view() == opened) << text;
    EXPECT_EQ(answer.status(false).ok(), result == Result::kText) << text;
    EXPECT_EQ(answer.status(true).ok(), result == Result::kText || result == Result::kBytes) << text;
  }
}

// A second run has nothing to do, and what an earlier one has made is not made again, but for the record that it had
// not finished.
TEST_F(Folder, ResumesWhatWasStopped) {
  const TempFolder folder;
  const std::string in = folder.file("in"), made = folder.file("made");
  const auto converted = [&](const std::string& options) {
    return ran(wordsOf("ldif --to argon2id --memory 8 --rounds 1 " + in + options, {}));
  };
  putFile(in, expanded("<A><P>secret\n<P>{SHA}x\npwdHistory: <H>5#other\n\ndn:: Y8O8\n<P>secret\n\n", names()));
  const std::string changes = converted(" --changes").out;
  const std::string argon = "\\{ARGON2}\\$argon2id\\$v=19\\$m=8,t=1,p=1\\$[^ ]*\n-\n\n";
  EXPECT_TRUE(matches(changes, expanded("^<M>delete: <U>\n<P>secret\n-\nadd: <U>\n<P>", names()) + argon)) << changes;
  const size_t last = changes.rfind("dn:: ");
  putFile(made, changes.substr(0, changes.size() - 1));
  const Ran resumed = converted(" --changes --resume " + made);
  EXPECT_TRUE(matches(resumed.err, "converted: 3.*taken from the earlier run: 2")) << resumed.err;
  EXPECT_TRUE(resumed.out != changes && resumed.out.substr(0, last) == changes.substr(0, last)) << resumed.out;
  putFile(made, changes);
  putFile(in, converted(" --resume " + made).out);
  std::istringstream lines(changes);
  for (std::string line; std::getline(lines, line);) {
    const bool other = line.find("{ARGON2}") == std::string::npos;
    EXPECT_TRUE(other || fileContent(in).find(line) != std::string::npos) << line;
  }
  const Ran again = converted("");
  EXPECT_TRUE(matches(again.err, "converted: 0.*done already, kept: 3")) << again.err;
  EXPECT_EQ(again.out, fileContent(in));
}

TEST_F(Folder, FindingsAndAttributesHaveLimits) {
  const TempFolder folder;
  std::string text;
  for (int i = 0; i < 1002; ++i) text += "dn: a\nuserPassword: {X}\n\n";
  putFile(folder.file("in"), text);
  const Ran result = ran({"ldif", "--to", "sha", folder.file("in")});
  EXPECT_TRUE(matches(result.err, "line 2999: a: .*\nldappw: 2 more: unknown tag; the value is kept\n")) << result.err;
  EXPECT_EQ(result.err.find("line 3002"), std::string::npos);
  std::vector<std::string> arguments(65, "--attribute=a");
  arguments.insert(arguments.begin(), {"ldif", "--to", "sha", folder.file("in")});
  EXPECT_TRUE(matches(ran(arguments).err, "more than 64 attributes"));
}

// ---- Exports of somebody who wants the command to fail or to be blind ----

std::string repeated(const char* line, size_t times) {
  std::string text;
  for (size_t i = 0; i < times; ++i) {
    const std::string once = line;
    const size_t place = once.find('%');
    text += once.substr(0, place);
    if (place != std::string::npos) text += std::to_string(i) + once.substr(place + 1);
  }
  return text;
}

struct Growth {
  const char* name;
  size_t longDn;      // so many bytes a line
  const char* lines;  // one after the other, each with its number
  const char* batch;  // likewise
  const char* arguments;
  size_t times;
};
const Growth kGrowth[] = {
    {"equal values in changes", 0, "userPassword: p%\nuserPassword: p%\n", "", "ldif --to sha --changes in", 2500},
    {"equal values in an export", 0, "userPassword: p%\nuserPassword: p%\n", "", "ldif --to sha in", 2500},
    {"names and passwords", 0, "cn: p%x\nuserPassword: q%x\n", "", "audit in", 3000},
    {"names and hashes", 0, "cn: p%\nuserPassword: {SMD5}wMhWRf3bkgrQqmBHRrz4CR5dBtQ=\n", "", "audit --check-hashes in",
     500},
    {"passwords for one entry", 0, "userPassword: p%\n", "cn=a\tq%\n", "verify --clear --batch batch --ldif in", 500},
    {"lines below a long dn", 1, "cn: b\n", "", "audit in", 16000},
    {"values below a long dn", 1, "userPassword: {SHA}5en6G6MezRroT3XKqkdPOmY/BfQ=\n", "cn=a\tq%\n",
     "verify --batch batch --ldif in", 4000},
};

// Four times the input may take seven times as long; what looks at each pair takes sixteen times.
TEST(HostileExports, CostGrowsWithTheInputAndNoFaster) {
  const TempFolder folder;
  std::filesystem::current_path(folder.file("."));
  for (const Growth& row : kGrowth) {
    const auto spent = [&](size_t times) {
      putFile("in", "dn: cn=a" + std::string(row.longDn * times, 'x') + "\n" + repeated(row.lines, times));
      putFile("batch", repeated(row.batch, times));
      const std::clock_t before = std::clock();
      ran(wordsOf(row.arguments, {}));
      return std::clock() - before + CLOCKS_PER_SEC / 100;
    };
    EXPECT_LE(spent(4 * row.times), 7 * spent(row.times)) << row.name;
  }
  std::filesystem::current_path("/");
}

// The output of one entry can be thousands of times the entry, and so can what is said of it.
[[noreturn]] void runInLittleMemory(const std::string& line, const std::vector<std::string>& arguments) {
  putFile("in", "dn: cn=" + std::string(60000, 'x') + "\n" + repeated(line.c_str(), 6000));
  const int null = open("/dev/null", O_RDWR);
  dup2(null, STDOUT_FILENO);
  const int answer = dup(STDERR_FILENO);
  dup2(null, STDERR_FILENO);
  std::vector<char*> pointers;
  for (const std::string& argument : arguments) pointers.push_back(const_cast<char*>(argument.c_str()));
  pointers.push_back(nullptr);
  const int code = tool::runCommand(static_cast<int>(arguments.size()), pointers.data());
  rusage used{};
  getrusage(RUSAGE_SELF, &used);
  dprintf(answer, "code %d, %s memory\n", code, used.ru_maxrss < 200 * 1024 ? "little" : "much");
  _exit(0);
}

TEST(HostileExportsDeathTest, MemoryIsBounded) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
  GTEST_SKIP() << "what was released is kept by the sanitizer";
#endif
  testing::FLAGS_gtest_death_test_style = "threadsafe";
  const TempFolder folder;
  std::filesystem::current_path(folder.file("."));
  EXPECT_EXIT(runInLittleMemory("userPassword: p%\n", {"ldappw", "ldif", "--to", "sha", "--changes", "in"}),
              testing::ExitedWithCode(0), "code 0, little memory");
  EXPECT_EXIT(runInLittleMemory("userPassword: {X}%\n", {"ldappw", "ldif", "--to", "sha", "in"}),
              testing::ExitedWithCode(0), "code 3, little memory");
  EXPECT_EXIT(runInLittleMemory("userPassword: p%\n", {"ldappw", "ldif", "--audit", "--verbose", "in"}),
              testing::ExitedWithCode(0), "code 0, little memory");
  std::filesystem::current_path("/");
}

TEST_F(Folder, LongDns) {
  const TempFolder folder;
  const std::string in = folder.file("in");
  const std::string longest(65536, 'x');
  putFile(in, "dn: " + longest + "\nuserPassword: {X}\n");
  const Ran most = ran({"ldif", "--to", "sha", in});
  EXPECT_TRUE(most.code == 3 && most.err.size() < 1500) << most.err;
  putFile(in, "dn: " + longest + "x\nuserPassword: {X}\n");
  EXPECT_TRUE(matches(ran({"ldif", "--to", "sha", in}).err, "^ldappw: the dn in line 1 is longer than 64 KiB\n"));
  // Entries that begin alike are two, and have one password.
  const std::string begin = "dn: cn=" + std::string(600, 'x');
  putFile(in, begin + "1\nuserPassword: secret\n\n" + begin + "2\nuserPassword: secret\n");
  EXPECT_TRUE(matches(ran({"audit", in}).out, "finding: reused: 2\n"));
  putFile(in, begin + "1\nuserPassword: secret\n\n" + begin + "1\nuserPassword: secret\n");
  EXPECT_FALSE(matches(ran({"audit", in}).out, "finding: reused"));
}

}  // namespace
