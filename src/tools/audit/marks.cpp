// SPDX-License-Identifier: Apache-2.0
#include "audit/marks.h"

#include <algorithm>
#include <cstring>

#include "audit/facts.h"
#include "base/random.h"

namespace tool {

MarkKey::MarkKey() {
  drawRandom(&key_, sizeof key_);
}

MarkKey::~MarkKey() {
  explicit_bzero(&key_, sizeof key_);
}

// HMAC with a whole block of key bytes for each of the two digests.
Mark MarkKey::of(Sha256& sha256, MarkKind kind, std::string_view bytes) const {
  const char label = static_cast<char>(kind);
  const auto viewOf = [](const Sha256::Digest& digest) {
    return std::string_view(reinterpret_cast<const char*>(digest.data()), digest.size());
  };
  const Sha256::Digest inner = sha256.of({{key_.inner, sizeof key_.inner}, {&label, 1}, bytes});
  const Sha256::Digest outer = sha256.of({{key_.outer, sizeof key_.outer}, viewOf(inner)});
  Mark mark;
  memcpy(&mark.first, outer.data(), sizeof mark.first);
  memcpy(&mark.second, outer.data() + sizeof mark.first, sizeof mark.second);
  return mark;
}

size_t endOfRdn(std::string_view dn) noexcept {
  for (size_t i = 0; i < dn.size(); ++i) {
    if (dn[i] == ',') return i;
    if (dn[i] == '\\') ++i;
  }
  return std::string_view::npos;
}

// The number of the part behind the first RDN, which is cut off; 0 when it is kept with the RDN.
std::uint32_t DnStore::parentOf(std::string_view& dn) {
  const size_t end = endOfRdn(dn);
  if (end == std::string_view::npos) return 0;
  const std::string_view parent = dn.substr(end);
  auto found = numbers_.find(parent);
  if (found == numbers_.end()) {
    if (parents_.size() == kMostParents) return 0;
    found = numbers_.emplace(parent, static_cast<std::uint32_t>(parents_.size())).first;
    parents_.emplace_back(parent);
  }
  dn.remove_suffix(dn.size() - end);
  return found->second;
}

DnStore::Place DnStore::add(std::string_view dn) {
  const std::uint32_t parent = parentOf(dn);
  const auto length = static_cast<std::uint16_t>(std::min<size_t>(dn.size(), UINT16_MAX));
  const size_t bytes = sizeof parent + sizeof length + length;
  if (used_ + bytes > kBlockBytes) {
    blocks_.push_back(std::make_unique<char[]>(kBlockBytes));
    used_ = 0;
  }
  char* at = blocks_.back().get() + used_;
  memcpy(at, &parent, sizeof parent);
  memcpy(at + sizeof parent, &length, sizeof length);
  std::copy_n(dn.data(), length, at + sizeof parent + sizeof length);
  const Place place = (blocks_.size() - 1) * kBlockBytes + used_;
  used_ += bytes;
  return place;
}

std::pair<std::uint32_t, std::string_view> DnStore::keyAt(Place place) const noexcept {
  const char* from = blocks_[static_cast<size_t>(place / kBlockBytes)].get() + place % kBlockBytes;
  std::uint32_t parent = 0;
  std::uint16_t length = 0;
  memcpy(&parent, from, sizeof parent);
  memcpy(&length, from + sizeof parent, sizeof length);
  return {parent, {from + sizeof parent + sizeof length, length}};
}

std::string DnStore::at(Place place) const {
  const auto [parent, rest] = keyAt(place);
  return std::string(rest) + parents_[parent];
}

void Reuse::add(const Facts& batch) {
  std::vector<DnStore::Place> places;
  places.reserve(batch.holders.size());
  for (const std::string& dn : batch.holders) places.push_back(dns_.add(dn));
  for (const Sighting& one : batch.sightings) sightings_.emplace_back(one.mark, places[one.holder]);
}

// Where the entries of a run of equal marks are, in the order of the input. Copies of an entry, in one export or in
// several, are one entry.
std::vector<DnStore::Place> Reuse::membersOf(const Run& run) const {
  std::vector<DnStore::Place> places;
  places.reserve(run.last - run.first);
  for (size_t i = run.first; i < run.last; ++i) places.push_back(sightings_[i].second);
  std::sort(places.begin(), places.end(),
            [this](DnStore::Place a, DnStore::Place b) { return dns_.same(a, b) ? a < b : dns_.before(a, b); });
  const auto sameName = [this](DnStore::Place a, DnStore::Place b) { return dns_.same(a, b); };
  places.erase(std::unique(places.begin(), places.end(), sameName), places.end());
  std::sort(places.begin(), places.end());
  return places;
}

std::vector<Reuse::Run> Reuse::runs(std::vector<DnStore::Place>& shared) {
  std::sort(sightings_.begin(), sightings_.end());
  std::vector<Run> found;
  for (size_t first = 0, last = 0; first < sightings_.size(); first = last) {
    while (last < sightings_.size() && sightings_[last].first == sightings_[first].first) ++last;
    if (last - first < 2) continue;
    Run run{first, last, 0, 0};
    const std::vector<DnStore::Place> members = membersOf(run);
    if (members.size() < 2) continue;
    run.entries = members.size();
    run.begin = members.front();
    found.push_back(run);
    shared.insert(shared.end(), members.begin(), members.end());
  }
  return found;
}

std::vector<ReuseGroup> Reuse::finish(Facts& sum, size_t most, std::uint64_t& groupCount) {
  std::vector<DnStore::Place> shared;
  std::vector<Run> found = runs(shared);
  groupCount = found.size();
  std::sort(shared.begin(), shared.end());
  shared.erase(std::unique(shared.begin(), shared.end()), shared.end());
  for (const DnStore::Place place : shared) sum.of(Finding::kReused).note(dns_.at(place), most);

  // Nothing depends on the marks, which differ from run to run.
  std::sort(found.begin(), found.end(), [](const Run& a, const Run& b) {
    return a.entries != b.entries ? a.entries > b.entries : a.begin < b.begin;
  });
  std::vector<ReuseGroup> largest;
  for (size_t i = 0; i < found.size() && i < most; ++i) {
    largest.push_back({found[i].entries, {}});
    const std::vector<DnStore::Place> members = membersOf(found[i]);
    for (size_t j = 0; j < members.size() && j < most; ++j) largest.back().dns.push_back(dns_.at(members[j]));
  }
  return largest;
}

}  // namespace tool
