// SPDX-License-Identifier: Apache-2.0
// Directory exports: conversions to the byte, the readers that they stand on, and resuming what was stopped.
#include <algorithm>

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
  for (const size_t bytes : {0, 75, 76, 77, 151, 152, 300}) {
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

}  // namespace
