#pragma once

#include "foundation/Value.h"
#include "platform/Log.h"

namespace telvane {

// Splits every text of a bag's "shared_values" at "," into an array of texts; values of other types stay.
Dictionary splitMacroValues(const Dictionary& sharedValues);

// Whether the value is a text that reads as the name of a macro, defined or not.
bool isMacroName(const Value& value);
// Returns what stands in the value's place when it is expanded; null when it stays as it is.
const Value* macroNamedBy(const Value& value, const Dictionary& macros);

// Replaces the value under the key by its expansion: every text at any depth that begins with "==" and names a macro
// becomes that macro's value, which is not expanded again. Nothing happens when the key is absent.
void expandMacroForDataSet(Log& log, Dictionary& container, const Key& key, const Dictionary& macros);

// Returns the inner bag without "shared_values" and with the four environment sections expanded; as it is when it
// defines no macros.
Dictionary expandStorebag(Log& log, const Dictionary& inner);

}  // namespace telvane
