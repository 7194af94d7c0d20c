// SPDX-License-Identifier: Apache-2.0
// Making password values anew. A value that cannot be carried over unharmed stays what it was and becomes a finding:
// the export is often the only copy of the passwords in it.
#include "ldif_convert.h"

namespace tool {
namespace {

using Counter = std::uint64_t ConvertTally::*;

// What became of one value: the counter that it goes to, and the finding if there is one.
struct Outcome {
  Counter counter;
  Status status;
};

Outcome failed(Status status) {
  return {&ConvertTally::failed, status};
}

Status targetProblem(const Scheme& target, std::string_view clear) {
  if (target.code == FORMAT_QVEIL && clear.size() > target.cutBytes) {
    return {kBadValue, "the password has more bytes than the scheme holds"};
  }
  return passwordProblem(target, clear);
}

// The new value takes the place of the only copy, so the server's own check has to accept it first.
Status checkMade(const Secret& made, const Secret& clear, const ConvertOptions& options) {
  if (options.target->code == FORMAT_NONE) return {};
  const int different = verify_password(clear.c_str(), static_cast<int>(clear.size()), made.c_str(),
                                        static_cast<int>(made.size()), 1, options.newKeys.get());
  if (different != 0) return {kBadValue, "the new value does not verify"};
  return {};
}

Outcome convertValue(const Secret& value, const ConvertOptions& options, Secret& made) {
  const Scheme& source = schemeOf(value.view());
  const Scheme& target = *options.target;
  const bool clearSource = source.code == FORMAT_NONE;
  if (unknownTag(value.view())) return {&ConvertTally::unknownTags, {kBadValue, "unknown tag; the value is kept"}};
  if (!clearSource && !source.reversible) {
    const LookText& look = kLooks[static_cast<int>(lookOf(value.view()))];
    if (look.code != kSuccess) return {&ConvertTally::malformed, {look.code, look.text}};
    return {&ConvertTally::oneWay, {}};
  }
  if (clearSource && target.code == FORMAT_NONE) return {&ConvertTally::asTheyAre, {}};

  Secret clear;
  Status status = revealValue(value.view(), options.oldKeys, clear);
  if (!status.ok()) return failed(status);
  if (!clearSource && !options.allowBinary && !looksLikeText(clear.view())) {
    return failed({kBadKey, "opens into bytes that are not text: a wrong key, or a binary password (--allow-binary)"});
  }
  status = targetProblem(target, clear.view());
  if (status.ok()) status = formatPassword(target, options.newKeys, clear, made);
  if (status.ok()) status = checkMade(made, clear, options);
  if (!status.ok()) return failed(status);
  return {target.cutBytes != 0 && clear.size() > target.cutBytes ? &ConvertTally::cut : &ConvertTally::made, {}};
}

Outcome outcomeOf(const PasswordLine& password, const ConvertOptions& options, Secret& made) {
  switch (password.form) {
    case ValueForm::kUrl:
      return {&ConvertTally::urls, {}};
    case ValueForm::kDeleted:
      return {&ConvertTally::deleted, {}};
    case ValueForm::kBroken:
      return failed({kBadValue, password.problem});
    case ValueForm::kBytes:
      break;
  }
  return convertValue(password.value, options, made);
}

void convertLine(const RecordWalker& walker, const ConvertOptions& options, ConvertResult& result) {
  Secret made;
  const Outcome outcome = outcomeOf(walker.password(), options, made);
  ++result.tally.values;
  ++(result.tally.*outcome.counter);
  if (outcome.counter == &ConvertTally::cut) ++result.tally.made;
  if (!outcome.status.ok()) result.findings.push_back(findingAt(walker, outcome.status));
  if (outcome.counter == &ConvertTally::made || outcome.counter == &ConvertTally::cut) {
    writeChanged(walker.line(), walker.password().description, made, result.out);
  } else {
    result.out.append(walker.line().raw);
  }
}

}  // namespace

const std::array<ConvertField, 11> kConvertFields = {{
    {"entries", "entries", &ConvertTally::entries},
    {"values", "password values", &ConvertTally::values},
    {"made", "made anew", &ConvertTally::made},
    {"cut", "of these cut by the scheme", &ConvertTally::cut},
    {"asTheyAre", "clear already, kept", &ConvertTally::asTheyAre},
    {"oneWay", "one-way, kept", &ConvertTally::oneWay},
    {"urls", "behind a URL, kept", &ConvertTally::urls},
    {"deleted", "to be deleted, kept", &ConvertTally::deleted},
    {"unknownTags", "with an unknown tag, kept", &ConvertTally::unknownTags},
    {"malformed", "malformed, kept", &ConvertTally::malformed},
    {"failed", "failed, kept", &ConvertTally::failed},
}};

ConvertResult convertBatch(const Batch& batch, const AttributeSet& attributes, const ConvertOptions& options) {
  ConvertResult result;
  result.out.reserve(batch.text.size() + batch.text.size() / 4);
  RecordWalker walker(batch, attributes);
  while (walker.next()) {
    if (walker.atPassword()) {
      convertLine(walker, options, result);
    } else {
      result.out.append(walker.line().raw);
    }
  }
  result.tally.entries = walker.entries();
  return result;
}

}  // namespace tool
