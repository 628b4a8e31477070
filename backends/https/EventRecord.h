#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/Event.h"
#include "backends/https/EventFilters.h"
#include "backends/https/RecordLayer.h"
#include "backends/https/ReservedKeys.h"
#include "backends/https/SessionFields.h"
#include "interface/Values.h"

namespace orvanta {

class FieldWriter;

// One event as it will be sent. To the outside it is one flat dictionary: the client's payload, the reserved keys over
// it, the user info over those, filters applied to the result; a flush lays a new session identifier and its own user
// info on top. Inside it is kept as those layers, which are shared and never copied, and they come together only as
// JSON.
//
// Made and prepared on the session's queue; afterwards immutable.
class EventRecord {
 public:
  // `combinedSessionID` gives way to the session's number where the session reports that. `timezoneOffset`: seconds
  // east of GMT.
  EventRecord(std::shared_ptr<const SessionFields> fields, Event event, std::optional<std::string> combinedSessionID,
              std::int32_t timezoneOffset);

  // Merges the user info (null: none) and applies the filters. Once.
  void prepare(std::shared_ptr<const RecordLayer> userInfo, const EventFilters& filters);

  // The integer reading of the prepared record's "_method", 0 when user info or a filter left none.
  std::int32_t category() const { return _category; }
  // About how much memory the record keeps alive, in bytes.
  std::size_t footprint() const;

  // What is laid over a batched record.
  struct Overlay {
    bool relabelled = false;                 // "_sessionID" is `sessionID`, whatever the record held
    const std::string* sessionID = nullptr;  // null: removed
    const RecordLayer* userInfo = nullptr;
  };
  // Writes the record's fields, each visible key once. Values that can never be sent are left out.
  void write(FieldWriter& writer, const Overlay& overlay) const;

 private:
  // What a filter made of the field that was visible under the key.
  struct Change {
    std::string_view key;               // in a layer that the record shares
    std::optional<std::string> digest;  // none: removed
  };

  std::int32_t visibleNumber(ReservedKey key) const;
  Value ownValue(ReservedKey key) const;
  void applyFilters(const EventFilters& filters);
  const Change* changeOf(std::string_view key) const;
  void writeReserved(FieldWriter& writer, ReservedKeys hidden) const;

  std::shared_ptr<const SessionFields> _fields;
  Event _event;
  std::shared_ptr<const RecordLayer> _userInfo;
  std::optional<std::string> _combinedSessionID;
  std::vector<Change> _changes;  // sorted by key; nearly always empty
  double _clientTS = 0;          // seconds, finite
  std::int32_t _timezoneOffset = 0;
  std::int32_t _category = 0;
  ReservedKeys _present = 0;
};

}  // namespace orvanta
