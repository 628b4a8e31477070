#pragma once

#include <string>
#include <string_view>

#include "platform/core/Result.h"
#include "platform/core/Utf8.h"
#include "platform/core/Value.h"

namespace orvanta::platform {

// Compact or indented JSON of a value. Data becomes base64 text, a date its seconds, NaN and infinities null.
std::string writeJson(const Value& value, bool pretty = false);
// One JSON document. Numbers without a fraction or exponent that fit become integers. Refuses, with the offset: text
// that is not UTF-8, a key that occurs twice in an object, nesting deeper than 64, anything behind the document.
Result<Value> parseJson(std::string_view text);

// Appends `text` in quotes with JSON's escapes; each malformed UTF-8 sequence becomes U+FFFD.
void appendJsonString(std::string& out, std::string_view text);
// Appends a number as JSON. False, with nothing appended, for NaN and infinities.
bool appendJsonNumber(std::string& out, double v);
void appendJsonNumber(std::string& out, std::int64_t v);
void appendJsonNumber(std::string& out, std::uint64_t v);

}  // namespace orvanta::platform
