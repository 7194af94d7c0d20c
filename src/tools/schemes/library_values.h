// SPDX-License-Identifier: Apache-2.0
// The columns of the scheme table for the schemes of the library, and for clear text.
#pragma once

#include <string_view>

#include "schemes/scheme.h"

namespace tool {

// Payloads: base64 of a number of bytes; 13 characters of crypt's alphabet; a masked record in its wrapping.
const char* base64Problem(const PayloadRule& rule, std::string_view payload);
const char* cryptProblem(const PayloadRule& rule, std::string_view payload);
const char* maskedProblem(const PayloadRule& rule, std::string_view payload);

// A password that the library would take for a value.
const char* shaPasswordProblem(std::string_view password);

Status makeClear(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password, Secret& out);
Status makeByLibrary(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password,
                     Secret& out);
Status makeCrypt(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password,
                 Secret& out);  // draws a salt

// Of 20 bytes of salt unless the costs ask for others.
Status makeSsha(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password, Secret& out);

Status openClear(const StoredValue& value, const KeyRecord& key, Secret& out);
Status openByLibrary(const StoredValue& value, const KeyRecord& key, Secret& out);

Status checkByLibrary(const StoredValue& value, const KeyRecord& key, const Secret& password);
// For the AES schemes: the library checks by making the value again in 1024 bytes, which cannot tell a wrong key from a
// wrong password and does not hold a long one.
Status checkByOpening(const StoredValue& value, const KeyRecord& key, const Secret& password);

}  // namespace tool
