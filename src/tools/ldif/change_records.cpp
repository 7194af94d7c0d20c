// SPDX-License-Identifier: Apache-2.0
#include "ldif/change_records.h"

#include <utility>

#include "base/input.h"
#include "base/text.h"

namespace tool {
namespace {

constexpr std::string_view kRecordEnd = "\n\n";

}  // namespace

void ChangeWriter::startEntry(const RecordWalker& walker, ExportPart& part) {
  if (entry_ == walker.entries()) return;
  flush(part);
  entry_ = walker.entries();
  dn_ = walker.dn();
}

ChangeWriter::Change* ChangeWriter::find(const RecordWalker& walker, const Secret& made) {
  const auto found = places_.find(keyOf(walker.password().description, made.view()));
  return found != places_.end() ? &changes_[found->second] : nullptr;
}

ChangeWriter::Change& ChangeWriter::add(const RecordWalker& walker, const Secret& made, bool adds) {
  const std::string& description = walker.password().description;
  places_.emplace(keyOf(description, made.view()), changes_.size());
  changes_.push_back({description, {}, Secret(made.view()), adds});
  return changes_.back();
}

void ChangeWriter::replace(const RecordWalker& walker, const Secret& old, const Secret& made, ExportPart& part) {
  startEntry(walker, part);
  add(walker, made, true).olds.emplace_back(old.view());
}

void ChangeWriter::drop(const RecordWalker& walker, const Secret& old, const Secret& made, bool isNew,
                        ExportPart& part) {
  startEntry(walker, part);
  Change* change = find(walker, made);
  if (!isNew) {
    if (change != nullptr) change->adds = false;
    return;
  }
  if (change == nullptr) change = &add(walker, made, false);
  change->olds.emplace_back(old.view());
}

void ChangeWriter::flush(ExportPart& part) {
  Secret& out = part.out;
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
    part.spill();
  }
  changes_.clear();
  places_.clear();
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
    Values* values = nullptr;
    std::uint64_t record = 0;
    while (walker.next()) {
      if (!walker.atPassword()) continue;
      if (values == nullptr || walker.entries() != record) {
        keys.clear();
        values = &entries_[walker.dn()];
      }
      record = walker.entries();
      const PasswordLine& password = walker.password();
      if (password.form == ValueForm::kDeleted) keys.push_back(keyOf(password.description, password.value.view()));
      if (password.form != ValueForm::kBytes) continue;
      for (Secret& key : keys) (*values)[std::move(key)] = password.whole(password.value);
      keys.clear();
    }
  }
}

const EarlierChanges::Values* EarlierChanges::of(const std::string& dn) const {
  const auto found = entries_.find(dn);
  return found != entries_.end() ? &found->second : nullptr;
}

}  // namespace tool
