// SPDX-License-Identifier: Apache-2.0
// Making, checking and opening foreign values: the columns of their table. Each is for the payloads that the column of
// the payload accepts; the row's algorithm says which digest, crypt prefix or Argon2 type it is.
#pragma once

#include <string_view>

#include "schemes/scheme.h"

namespace tool {

Status openPlain(const StoredValue& value, const KeyRecord& key, Secret& out);
Status openBase64(const StoredValue& value, const KeyRecord& key, Secret& out);

Status checkOpened(const StoredValue& value, const KeyRecord& key, const Secret& password);
Status checkDigest(const StoredValue& value, const KeyRecord& key, const Secret& password);  // digest, then any salt
Status checkHexDigest(const StoredValue& value, const KeyRecord& key, const Secret& password);
Status checkCrypt3(const StoredValue& value, const KeyRecord& key, const Secret& password);
Status checkNtHash(const StoredValue& value, const KeyRecord& key, const Secret& password);
Status checkPbkdf2(const StoredValue& value, const KeyRecord& key, const Secret& password);
Status checkScram(const StoredValue& value, const KeyRecord& key, const Secret& password);
Status checkArgon2(const StoredValue& value, const KeyRecord& key, const Secret& password);

// Costs are within the row's and complete.
Status makeSalted(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password, Secret& out);
Status makeCrypt3(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password, Secret& out);
Status makePbkdf2(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password, Secret& out);
Status makeArgon2(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password, Secret& out);

const char* crypt3PasswordProblem(std::string_view password);

}  // namespace tool
