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

// One event as it will be sent. To the outside it is one flat dictionary, made in these steps, in which a later one
// replaces what an earlier one left under the same key:
//
//     made       payload ◄─ reserved keys (session, device, time)
//     prepared   ◄─ user info, then the filters' removals and digests
//     written    ◄─ relabelling: "_sessionID" replaced or removed     ┐ only for those that
//                ◄─ user info of the flush, filtered by itself        ┘ waited in a batch
//
// Inside it is kept as those layers, which are shared with other events and never copied, plus the few changes that
// filters made. Nearly always the layers have no key in common but those of the payload that give way: then the shared
// ones are written as the JSON that they hold ready. Where user info names a reserved key, a filter changed one or a
// field of the user info, or the flush has other user info than the record, the steps are carried out on a dictionary.
//
// Made and prepared on the session's queue; afterwards immutable.
class EventRecord {
 public:
  // `combinedSessionID` gives way to the session's number where the session reports that. `timezoneOffset`: seconds
  // east of GMT.
  EventRecord(std::shared_ptr<const SessionFields> fields, Event event, std::optional<std::string> combinedSessionID,
              std::int32_t timezoneOffset);

  // Merges the user info, which may be null, and applies the filters. Called once.
  void prepare(std::shared_ptr<const RecordLayer> userInfo, const EventFilters& filters);

  // The integer reading of the prepared record's "_method", 0 when user info or a filter removed it.
  std::int32_t category() const { return _category; }
  // About how much memory the record keeps alive, in bytes.
  std::size_t footprint() const;

  // The layers over a batched record.
  struct Overlay {
    bool relabelled = false;                 // "_sessionID" is `sessionID`, whatever the record held
    const std::string* sessionID = nullptr;  // null: removed
    const RecordLayer* userInfo = nullptr;
  };
  // Writes the record's fields, each visible key once. Values that can never be sent are left out.
  void write(FieldWriter& writer, const Overlay& overlay) const;

 private:
  // A filter's work on the field that was visible under the key.
  struct Change {
    std::string_view key;               // in a layer that the record shares
    std::optional<std::string> digest;  // nullopt: removed
  };

  std::int32_t visibleNumber(ReservedKey key) const;
  Value ownValue(ReservedKey key) const;
  void applyFilters(const EventFilters& filters);
  const Change* changeOf(std::string_view key) const;
  // The two ways to write. `info`: the one user info that there is, without reserved keys; may be null.
  void writeLayers(FieldWriter& writer, const Overlay& overlay, const RecordLayer* info) const;
  void writeReserved(FieldWriter& writer, bool withSessionID) const;
  Dictionary flatten(const Overlay& overlay) const;

  std::shared_ptr<const SessionFields> _fields;
  Event _event;
  std::shared_ptr<const RecordLayer> _userInfo;
  std::optional<std::string> _combinedSessionID;
  std::vector<Change> _changes;  // sorted by key; nearly always empty
  double _clientTS = 0;          // seconds, finite
  std::int32_t _timezoneOffset = 0;
  std::int32_t _category = 0;
  ReservedKeys _present = 0;  // of the payload's, these are hidden
  bool _filteredAbovePayload = false;
};

}  // namespace orvanta
