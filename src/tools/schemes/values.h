// SPDX-License-Identifier: Apache-2.0
// Making, checking and opening stored values under any scheme. May be called from many threads at once, with one
// KeyRecord for all of them.
#pragma once

#include <string_view>

#include "base/failure.h"
#include "base/secret.h"
#include "schemes/examine.h"
#include "schemes/key_record.h"
#include "schemes/scheme.h"

namespace tool {

// Why the scheme cannot hold the password unharmed. A cut (see cutBytes) is not a reason.
Status passwordProblem(const Scheme& scheme, std::string_view password);

// Makes the stored value of a password; for clear text that is the password. The AES schemes need key (kBadKey
// otherwise). Each call draws a salt of its own. Costs are those of completeCosts.
Status makeValue(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password, Secret& out);

// True for schemes whose values take long on purpose.
bool isCostly(const Scheme& scheme) noexcept;

// What is chosen, and the scheme's own choice for the rest. Throws Failure with kUsage for a cost that the scheme does
// not have or that it has within other bounds.
Costs completeCosts(const Scheme& scheme, const Costs& chosen);

// Turns a stored value into clear text; clear text comes back as it is. kBadValue for an unknown tag, a malformed
// payload or a one-way scheme; kBadKey for an AES value when there is no key, or when the key does not open it.
Status openValue(const Examined& value, const KeyRecord& key, Secret& out);

// Checks a password against a stored value: kSuccess, kNoMatch, or the problem (as of openValue, one-way schemes
// being fine). Bytes beyond comparedBytes do not count.
Status checkValue(const Examined& value, const KeyRecord& key, const Secret& password);

// The check that the server makes, which has no room for the AES value of a long password.
bool serverAccepts(const Secret& value, const KeyRecord& key, const Secret& password) noexcept;

}  // namespace tool
