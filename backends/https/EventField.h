#pragma once

#include <cstdint>
#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>

#include "backends/https/ReservedKeys.h"
#include "interface/Values.h"

namespace orvanta {

// Values that a field of an event may hold: a text, a number (booleans are numbers and stay booleans), or a date, which
// is sent as its seconds since 1970 (-1.0 when not finite). Everything else, NaN and infinities included, is never
// sent.

// Appends the field's value as JSON. Returns false, with nothing appended, for values that are never sent.
bool appendFieldValue(std::string& out, const Value& value);
// The text that a digest filter hashes: a text as it is, numbers and dates as the decimal text of what would be sent
// (booleans as 1 and 0). Nullopt for values that are never sent, which a digest must not make sendable.
std::optional<std::string> textForDigest(const Value& value);

// Writes the fields of one event's JSON object, compact or indented for people, in the order of the calls. Borrows the
// text for its lifetime.
class FieldWriter {
 public:
  enum class Form { compact, pretty };
  FieldWriter(std::string& out, Form form) : _out(out), _form(form) { _out.push_back('{'); }

  Form form() const { return _form; }
  // Fields that were written before in the compact form, each with its comma behind it. Only in that form.
  void fragment(std::string_view fields) { _out.append(fields); }
  // In the compact form, a value that is never sent is logged; the pretty form repeats what the compact one has logged.
  void value(std::string_view key, const Value& value);
  void text(std::string_view key, std::string_view text);
  void text(ReservedKey key, std::string_view text);
  void number(ReservedKey key, std::int64_t number);
  // Under each of the keys; formatting is what costs. `number` is finite.
  void number(std::initializer_list<ReservedKey> keys, double number);
  void finish();

 private:
  void key(std::string_view key);
  void key(ReservedKey key);

  std::string& _out;
  Form _form;
};

// The line for a value that is left out.
void logUnsendable(std::string_view key, const Value& value);

}  // namespace orvanta
