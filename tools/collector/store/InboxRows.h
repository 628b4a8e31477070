#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "tools/collector/store/Database.h"
#include "tools/collector/store/ReceivedRecords.h"

namespace orvanta::collector::rows {

// How records lie in the inbox's tables: the schema, and for each kind of record the statement that inserts one, the
// binding of its parameters, and the reading of a row. Called under the inbox's lock.
//
// The file outlives the program and is read by other tools: names and meanings of columns stay as they are.

extern const char* const kSchema;

// "SELECT …" up to and including FROM; the caller adds what it asks for. The readers below take its columns.
extern const std::string_view kSelectRequests;
extern const std::string_view kSelectEvents;  // with the request that each came in
extern const std::string_view kSelectDatagrams;

extern const std::string_view kInsertRequest;
extern const std::string_view kInsertEvent;  // request, position, text
extern const std::string_view kInsertDatagram;

// Each binds all parameters and takes the step that inserts the row. `id` of the record is not stored: SQLite gives it.
void insert(Statement& statement, const ReceivedRequest& request);
void insert(Statement& statement, const ReceivedDatagram& datagram);

ReceivedRequest readRequest(const Statement& statement);
ReceivedEvent readEvent(const Statement& statement);
ReceivedDatagram readDatagram(const Statement& statement);

}  // namespace orvanta::collector::rows
