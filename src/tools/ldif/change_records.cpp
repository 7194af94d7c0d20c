// SPDX-License-Identifier: Apache-2.0
#include "ldif/change_records.h"

#include <algorithm>
#include <utility>

#include "base/input.h"
#include "base/text.h"

namespace tool {
namespace {

constexpr std::string_view kRecordEnd = "\n\n";

Secret keyOf(const RecordWalker& walker, const Secret& old) {
  Secret key(walker.dn());
  key.append('\0');
  key.append(walker.password().description);
  key.append('\0');
  key.append(old.view());
  return key;
}

}  // namespace

void ChangeWriter::startEntry(const RecordWalker& walker, Secret& out) {
  if (entry_ == walker.entries()) return;
  flush(out);
  entry_ = walker.entries();
  dn_ = walker.dn();
}

ChangeWriter::Change* ChangeWriter::find(const RecordWalker& walker, const Secret& made) noexcept {
  const auto found = std::find_if(changes_.begin(), changes_.end(), [&](const Change& change) {
    return sameName(change.description, walker.password().description) && change.made.view() == made.view();
  });
  return found != changes_.end() ? &*found : nullptr;
}

void ChangeWriter::replace(const RecordWalker& walker, const Secret& old, const Secret& made, Secret& out) {
  startEntry(walker, out);
  changes_.push_back({walker.password().description, {}, Secret(made.view()), true});
  changes_.back().olds.emplace_back(old.view());
}

void ChangeWriter::drop(const RecordWalker& walker, const Secret& old, const Secret& made, bool isNew, Secret& out) {
  startEntry(walker, out);
  Change* change = find(walker, made);
  if (!isNew) {
    if (change != nullptr) change->adds = false;
    return;
  }
  if (change == nullptr) {
    changes_.push_back({walker.password().description, {}, Secret(made.view()), false});
    change = &changes_.back();
  }
  change->olds.emplace_back(old.view());
}

void ChangeWriter::flush(Secret& out) {
  for (const Change& change : changes_) {
    appendAttribute("dn", Secret(dn_), out);
    out.append("changetype: modify\ndelete: " + change.description + '\n');
    for (const Secret& old : change.olds) appendAttribute(change.description, old, out);
    out.append("-\n");
    if (change.adds) {
      out.append("add: " + change.description + '\n');
      appendAttribute(change.description, change.made, out);
      out.append("-\n");
    }
    out.append('\n');
  }
  changes_.clear();
}

void EarlierChanges::load(const std::string& path, const AttributeSet& attributes) {
  Input input(path);
  RecordReader reader(input);
  Batch batch;
  while (reader.next(batch)) {
    const size_t end = batch.text.view().rfind(kRecordEnd);
    batch.text.resize(end != std::string_view::npos ? end + kRecordEnd.size() : 0);
    RecordWalker walker(batch, attributes);
    std::vector<Secret> keys;
    std::uint64_t record = 0;
    while (walker.next()) {
      if (!walker.atPassword()) continue;
      if (walker.entries() != record) keys.clear();
      record = walker.entries();
      const PasswordLine& password = walker.password();
      if (password.form == ValueForm::kDeleted) keys.push_back(keyOf(walker, password.value));
      if (password.form != ValueForm::kBytes) continue;
      for (Secret& key : keys) values_[std::move(key)] = password.whole(password.value);
      keys.clear();
    }
  }
}

const Secret* EarlierChanges::find(const RecordWalker& walker, const Secret& old) const {
  if (values_.empty()) return nullptr;
  const auto found = values_.find(keyOf(walker, old));
  return found != values_.end() ? &found->second : nullptr;
}

}  // namespace tool
