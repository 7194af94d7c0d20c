// SPDX-License-Identifier: Apache-2.0
// The verbs that work on values and key stash files: what they answer, what they refuse, and that a refusal changes
// nothing. Digests and AES values were made by openssl, foreign values by the programs that their table names.
#include <algorithm>
#include <set>

#include "command.h"

using namespace test;
using namespace std::string_literals;

namespace {

class Command : public Folder, public testing::WithParamInterface<Row> {};

TEST_P(Command, Answers) {
  const Row& row = GetParam();
  const Ran result = ran(wordsOf(row[4], names()), row[5].empty() ? "secret\n" : expanded(row[5], names()));
  EXPECT_EQ(std::to_string(result.code), row[1]) << result.err;
  EXPECT_TRUE(matches(result.out, "^(" + row[2] + ")\n*$")) << result.out;
  EXPECT_TRUE(matches(result.err.substr(0, result.err.rfind('\n')), row[3])) << result.err;
}
INSTANTIATE_TEST_SUITE_P(Rows, Command, testing::ValuesIn(rowsOf("command.vec")), nameOf);

// Values and passwords, through verify; the answers are all the same.
std::string answersTo(const std::vector<std::string>& pairs) {
  const TempFolder folder;
  putFile(folder.file("pairs"), joined(pairs, '\n'));
  std::istringstream lines(ran({"verify", "--keys", "dir", "--batch", folder.file("pairs")}).out);
  std::set<std::string> answers;
  size_t count = 0;
  for (std::string line; std::getline(lines, line); ++count) answers.insert(line);
  return std::to_string(pairs.size() - count) +
         " without answer, others: " + joined({answers.begin(), answers.end()}, ' ');
}

// A scheme with its options, and how many bytes are opened: 0 for none.
class Schemes : public Folder, public testing::WithParamInterface<std::pair<const char*, size_t>> {};

TEST_P(Schemes, MatchAndOpen) {
  std::vector<std::string> passwords{std::string(46, 'y'), std::string(47, 'z'), std::string(510, 'x')};
  std::istringstream others(
      "\na\n12345678\n123456789\n blanks \nreturn\r\n{SSHA}abc\n{XYZ}\n>1abcdef<\n$(id)`\"\\\ngr\xc3\xbc\xc3\x9f\n");
  for (std::string line; std::getline(others, line);) passwords.push_back(line);
  const auto& [scheme, bytes] = GetParam();
  const std::string arguments = "format --allow-empty --keys dir --scheme "s + scheme;
  const std::string made = ran(wordsOf(arguments, {}), joined(passwords, '\n')).out;
  std::vector<std::string> right, wrong, opened;
  std::istringstream values(made);
  for (const std::string& password : passwords) {
    std::string value;
    std::getline(values, value);
    right.push_back(value + '\t' + password);
    wrong.push_back(value + "\t!" + password);
    opened.push_back(password.substr(0, bytes));
  }
  EXPECT_EQ(answersTo(right), "0 without answer, others: match ");
  EXPECT_EQ(answersTo(wrong), "0 without answer, others: no match ");
  EXPECT_TRUE(bytes == 0 || ran({"reveal", "--keys", "dir"}, made).out == joined(opened, '\n'));
}
INSTANTIATE_TEST_SUITE_P(Rows, Schemes,
                         testing::Values(std::pair{"sha", 0}, std::pair{"ssha", 0}, std::pair{"MD5", 0},
                                         std::pair{"{crypt}", 0}, std::pair{"qVEIL", 46}, std::pair{"aes128", 999},
                                         std::pair{"aes192", 999}, std::pair{"aes256", 999},
                                         std::pair{"argon2id --rounds 1 --memory 64 --parallelism 2", 0},
                                         std::pair{"{PBKDF2-SHA512} --rounds 1000", 0},
                                         std::pair{"yescrypt --rounds 1", 0},
                                         std::pair{"sha512-crypt --rounds 1000", 0}, std::pair{"ssha512", 0},
                                         std::pair{"ssha --salt-bytes 4", 0}));

TEST_F(Folder, ValuesOfAllServers) {
  std::vector<std::string> values, kinds, right, wrong;
  for (Row row : rowsOf("values.vec")) {
    values.push_back(expanded(row[5], names()));
    if (row[3].empty()) {
      right.push_back(values.back() + "\tsecret");
      wrong.push_back(values.back() + "\tSecret");
      row[3] = "well formed";
    }
    kinds.push_back(row[0] + '\t' + row[1] + '\t' + row[2] + '\t' + row[3] + '\t' + row[4]);
  }
  EXPECT_EQ(ran({"identify"}, joined(values, '\n')).out, joined(kinds, '\n'));
  EXPECT_EQ(answersTo(right), "0 without answer, others: match ");
  EXPECT_EQ(answersTo(wrong), "0 without answer, others: no match ");
}

TEST_F(Folder, ManyValues) {
  const auto linesIn = [](const std::string& text) { return std::count(text.begin(), text.end(), '\n'); };
  const std::string values = joined(std::vector<std::string>(50000, "{AES128}AAAAAAAAAAAAAAAAAAAAAA=="), '\n');
  EXPECT_EQ(linesIn(ran({"identify"}, values).out), 50000);
  const Ran unopened = ran({"reveal"}, values);
  EXPECT_EQ(unopened.out, std::string(50000, '\n'));  // results keep step
  EXPECT_EQ(linesIn(unopened.err), 1001);
  EXPECT_TRUE(matches(unopened.err, "ldappw: 49000 more: an AES value needs the key stash \\(--keys\\)\n$"));
  EXPECT_EQ(linesIn(ran({"reveal"}, values.substr(0, values.size() / 50)).err), 1000);
  std::istringstream made(ran({"format", "--scheme", "crypt"}, values.substr(0, 3300)).out);
  std::set<char> salts[2];
  for (std::string value; std::getline(made, value);) {
    for (const size_t i : {size_t{0}, size_t{1}}) salts[i].insert(value[7 + i]);
  }
  EXPECT_GT(std::min(salts[0].size(), salts[1].size()), 30U);  // of 64 characters, in 100 draws
}

TEST_F(Folder, GeneratedPasswordsAndNul) {
  const std::string made = ran({"format", "--scheme", "ssha", "--generate", "40"}).out;
  ASSERT_TRUE(matches(made, "^[a-km-zA-HJ-NP-Z2-9]{40}\t[^\t]*\n$")) << made;
  EXPECT_EQ(ran({"verify", made.substr(41, made.size() - 42)}, made.substr(0, 40)).code, 0);
  EXPECT_EQ(ran({"format", "--scheme", "md5", "--null"}, "abc\0a\nb\0"s).out,
            "{MD5}kAFQmDzST7DWlj99KOF/cg==\0{MD5}jN60RBfzwmgmWV1YIM9XAA==\0"s);
  EXPECT_EQ(ran({"reveal", "--null"}, "a\nb\0c\0"s).out, "a\nb\0c\0"s);
  EXPECT_EQ(ran({"identify", "--null"}, "\0\0"s).out,
            "clear\t1\tclear\twell formed\tclear\0"s + "clear\t1\tclear\twell formed\tclear\0"s);
}

}  // namespace
