// What the glyphwell verbs share to read their input: a file or standard input, tagged JSON
// parsed with the place of a syntax error, and a value flattened to request bytes.
#pragma once

#include <cstdint>
#include <iosfwd>
#include <nlohmann/json.hpp>
#include <string>

#include "platform/PropertyValues.h"

namespace glyphwell::tools {

/// Reads the whole file `path` into `*text`. False with a message in `*error` naming the file and
/// the reason when it cannot be opened or read, or when it holds more than `maximumSize` bytes
/// (then at most `maximumSize` + 1 bytes were read).
bool ReadFile(const std::string& path, std::string* text, std::string* error,
              size_t maximumSize = SIZE_MAX);

/// Reads the whole input named by `path` ("-" or empty: `in`). False with a message in `*error`
/// when the file cannot be opened or read.
bool ReadInput(const std::string& path, std::istream& in, std::string* text, std::string* error);

/// The name of the input in messages: the path, or "<stdin>".
std::string InputName(const std::string& path);

/// Reads and parses the tagged JSON of `path` (see ReadInput). False with a message in `*error`
/// naming the input and, for malformed JSON, the line and column.
bool ReadJSONInput(const std::string& path, std::istream& in, nlohmann::ordered_json* json,
                   std::string* error);

/// Flattens the property value of `json` into `*bytes`. False with a message in `*error` when
/// `json` is not a property value (the message names the place, see CreateValueFromJSON) or when
/// the writer cannot carry the value unchanged; `*bytes` is then empty.
bool FlattenJSON(const nlohmann::ordered_json& json, std::string* bytes, std::string* error);

/// Flattens `value` (not retained) into `*bytes`; false (and `*bytes` empty) when the writer
/// could not carry it unchanged.
bool FlattenValue(CFTypeRef value, std::string* bytes);

/// Reads the value flattened in `bytes` (any kind) and returns it as tagged JSON; null JSON for
/// no value. Every line the reader logs goes to `err` as its bare text. `*intact` tells whether a
/// value came back from a stream that was not corrupt.
nlohmann::ordered_json DecodeToJSON(const std::string& bytes, std::ostream& err, bool* intact);

} // namespace glyphwell::tools
