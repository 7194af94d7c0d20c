// SPDX-License-Identifier: Apache-2.0
// The command as a function in the test's process, and the tables of what it is to answer.
#pragma once

#include <gtest/gtest.h>
#include <regex.h>
#include <sys/mman.h>
#include <sys/stat.h>

#include <algorithm>
#include <map>

#include "command_line.h"
#include "support.h"

namespace test {

struct Ran {
  int code;
  std::string out, err;
};

// Runs the command, with files in the place of the standard descriptors. Each of its messages carries its name, and
// none holds what a terminal acts on, or "hunter2".
inline Ran ran(std::vector<std::string> arguments, const std::string& input = {}) {
  arguments.insert(arguments.begin(), "ldappw");
  std::vector<char*> pointers;
  for (std::string& argument : arguments) pointers.push_back(argument.data());
  pointers.push_back(nullptr);
  std::fflush(stdout);
  int before[3];
  std::string contents[3];
  for (const int i : {0, 1, 2}) {
    const int file = memfd_create("standard", 0);
    before[i] = dup(i);
    if (pwrite(file, input.data(), i == 0 ? input.size() : 0, 0) < 0 || dup2(file, i) != i) std::abort();
    close(file);
  }
  const int code = tool::runCommand(static_cast<int>(arguments.size()), pointers.data());
  for (const int i : {0, 1, 2}) {
    contents[i] = fileContent("/proc/self/fd/" + std::to_string(i));
    dup2(before[i], i);
    close(before[i]);
  }
  std::istringstream lines(contents[2]);
  for (std::string line; std::getline(lines, line);) {
    EXPECT_TRUE(line.rfind("ldappw: ", 0) == 0 && line.find("hunter2") == std::string::npos) << line;
    EXPECT_TRUE(std::none_of(line.begin(), line.end(), [](char c) { return iscntrl(static_cast<unsigned char>(c)); }));
  }
  return {code, contents[1], contents[2]};
}

// Of an extended regular expression, in which a dot is any character, newlines too.
inline bool matches(const std::string& text, const std::string& pattern) {
  regex_t compiled;
  if (regcomp(&compiled, pattern.c_str(), REG_EXTENDED | REG_NOSUB) != 0) return ADD_FAILURE() << pattern, false;
  const bool found = regexec(&compiled, text.c_str(), 0, nullptr, 0) == 0;
  regfree(&compiled);
  return found;
}

using Names = std::map<std::string, std::string>;

// The escapes of C, and the texts of names in angle brackets.
inline std::string expanded(const std::string& text, const Names& names) {
  static const std::string escapes = "n\nt\tr\re\x1b\\\\";
  std::string result;
  for (size_t i = 0; i < text.size(); ++i) {
    const auto name = text[i] == '<' ? names.find(text.substr(i + 1, text.find('>', i) - i - 1)) : names.end();
    if (name != names.end()) {
      result += name->second;
      i += name->first.size() + 1;
    } else if (text[i] != '\\') {
      result += text[i];
    } else if (text[++i] == 'x') {
      result += fromHex(text.substr(i + 1, 2));
      i += 2;
    } else {
      result += text[i] == '0' ? '\0' : escapes[escapes.find(text[i]) + 1];
    }
  }
  return result;
}

// The words of a command line.
inline std::vector<std::string> wordsOf(const std::string& line, const Names& names) {
  std::vector<std::string> words;
  std::istringstream rest(line);
  for (std::string word; rest >> word;) words.push_back(expanded(word, names));
  return words;
}

// A table in tests/data: a row a line, of cells between bars; those that a row leaves out are empty. A line that begins
// with two blanks goes on with the one before; "#" begins a comment, and "=|" a name for others.
using Row = std::vector<std::string>;
inline std::vector<Row> rowsOf(const std::string& table, char kind = '\0') {
  std::ifstream file(LDAPPW_TEST_DATA "/" + table);
  std::vector<std::string> lines;
  for (std::string line; std::getline(file, line);) {
    if (line.rfind("  ", 0) == 0) {
      lines.back() += line.substr(2);
    } else if (line[0] != '#') {
      lines.push_back(line);
    }
  }
  std::vector<Row> rows;
  for (const std::string& line : lines) {
    Row cells;
    std::istringstream rest(line);
    for (std::string cell; std::getline(rest, cell, '|');) cells.push_back(cell);
    cells.resize(8);
    if ((cells[0] == "=") == (kind == '=')) rows.push_back(cells);
  }
  return rows;
}

// For the names of parameterised tests.
inline std::string nameOf(const testing::TestParamInfo<Row>& row) {
  std::string name = row.param[0];
  std::replace_if(
      name.begin(), name.end(), [](char c) { return isalnum(static_cast<unsigned char>(c)) == 0; }, '_');
  return name;
}

inline const std::string kSsha = "{SSHA}gVK8WC9YyFT1gMsQHTGCgT3sSv5zYWx0";  // of "secret" with the salt "salt"
inline const std::string kAes = "{AES256}t8vqW3q3u4CC9qxS6LUu2Q==";         // of "secret" under the keys of fixedFile()

inline std::string joined(const std::vector<std::string>& parts, char end) {
  std::string text;
  for (const std::string& part : parts) text += part + end;
  return text;
}

inline const Names& names() {
  const auto masked = [](const std::string& password) {
    const std::string line = ran({"format", "--scheme", "qveil"}, password).out;
    return line.substr(0, line.find('\n'));
  };
  static const std::string bare = masked("secret").substr(std::strlen("{qVEIL}"));
  static const Names fixed{{"ssha", kSsha},
                           {"aes", kAes},
                           {"masked", "{qVEIL}" + bare},
                           {"bare", bare},
                           {"veiled", masked("\xff")},
                           {"zeros", std::string(800, '0')},
                           {"seed", "correct-horse-battery"},
                           {"nothing", ""},
                           {"long", std::string(1017, '0')},
                           {"a43", std::string(43, 'a')}};
  static const Names all = [] {
    Names with = fixed;
    for (const Row& row : rowsOf("ldif.vec", '=')) with[row[1]] = expanded(row[2], with);
    return with;
  }();
  return all;
}

// A folder with what the rows name; none of the tests changes it.
class Folder : public testing::Test {
 public:
  Folder() {
    std::filesystem::current_path(folder_.file("."));
    const std::string dir = fixedFile();
    const std::vector<std::string> pairs{kSsha + "\tsecret", kAes + "\tsecret", kSsha + "\tse\tcret", "{X}y\ta",
                                         "secret\tsecret"};
    for (const auto& [name, content] :
         Names{{"dir", dir},
               {"d2", dir.substr(0, 24) + std::string(72, 'n')},
               {"d3", dir.substr(0, 23) + "T" + std::string(72, 'm')},
               {"d\x1b[1m", dir},
               {"short", dir.substr(0, 90)},
               {"zeros", std::string(200, '\0')},
               {"seed", "correct-horse-battery\n"},
               {"salt", "saltsaltsalt\n"},
               {"value", kSsha + "\nother\n"},
               {"password", "secret\nother\n"},
               {"empty", ""},
               {"bad", "letmein77\r\nhunter2xyz\n\n"},
               {"entries", "UID=A,dc = x\tsecret\nuid=a,dc=x\told\nuid=b,dc=x\tb\nc\tc\nd\td\n"},
               {"pairs", joined(pairs, '\n') + "tabless\n"},
               {"pairs0", joined(pairs, '\0')}}) {
      putFile(name, content);
      chmod(name.c_str(), 0600);
    }
    std::filesystem::create_symlink("dir", "link");
    std::filesystem::create_symlink("nowhere", "loose");
    before_ = content();
  }
  ~Folder() override {
    EXPECT_EQ(content(), before_);
    std::filesystem::current_path("/");
  }

 private:
  static Names content() {
    Names all;
    for (const auto& entry : std::filesystem::directory_iterator(".")) all[entry.path()] = fileContent(entry.path());
    return all;
  }

  TempFolder folder_;
  Names before_;
};

}  // namespace test
