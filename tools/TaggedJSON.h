// Tagged JSON: the text form of property values used by the command-line tool and the tests.
//
// A JSON object is a dictionary with string keys, a string a string, true/false booleans, an
// integer a number of type 10 (8 bytes), a number with a fraction or exponent a number of type 13.
// Every other value is a tagged object:
//   {"$number": V, "$type": CODE}   any type code 1-16
//   {"$data": "<base64>"}           {"$url": "<string>"}      {"$uuid": "<8-4-4-4-12 hex>"}
//   {"$set": [...]}                 {"$array": [...]} (the same as a plain array)
//   {"$dict": [[key, value], ...]}  keys of any kind
//   {"$error": {"domain": S, "code": N}}
//   {"$charset": [[first, last], ...]}   code point ranges
// An object with a key starting with "$" is always read as a tagged object; a dictionary with
// such a key is written in the "$dict" form.
#pragma once

#include <nlohmann/json.hpp>
#include <string>

#include "platform/PropertyValues.h"

namespace glyphwell::tools {

/// The property value for `json`: a new reference the caller releases, or null with a message
/// in `*error` that names where in the input the problem is (a JSON pointer, "/" for the top).
CFTypeRef CreateValueFromJSON(const nlohmann::ordered_json& json, std::string* error);

/// The tagged JSON of `value` (null for a null value). Numbers of type 10 and 13 are written
/// plain, others tagged; a dictionary whose keys are all strings without a leading "$" is a
/// plain object. Dates and other kinds the stream cannot carry are written as
/// {"$unsupported": "<description>"}.
nlohmann::ordered_json ValueToJSON(CFTypeRef value);

} // namespace glyphwell::tools
