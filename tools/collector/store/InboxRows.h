#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "tools/collector/store/Database.h"
#include "tools/collector/store/ReceivedRecords.h"

namespace orvanta::collector::rows {

// How records lie in the inbox's tables: the schema, and for each kind of record its insertion and the reading of a
// row. Statements are used under the inbox's lock.
//
// The file outlives the program, and other tools read it: names and meanings of columns stay as they are.

extern const char* const kSchema;

// Up to and including FROM; the caller appends conditions, order and limit. The readers below expect these columns.
extern const std::string_view kSelectRequests;
extern const std::string_view kSelectEvents;  // joined with their requests
extern const std::string_view kSelectDatagrams;

extern const std::string_view kInsertRequest;
extern const std::string_view kInsertEvent;  // parameters: request, position, JSON
extern const std::string_view kInsertDatagram;

// Binds all parameters and inserts the row. The record's `id` is left to SQLite.
void insert(Statement& statement, const ReceivedRequest& request);
void insert(Statement& statement, const ReceivedDatagram& datagram);

ReceivedRequest readRequest(const Statement& statement);
ReceivedEvent readEvent(const Statement& statement);
ReceivedDatagram readDatagram(const Statement& statement);

}  // namespace orvanta::collector::rows
