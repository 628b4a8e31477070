#pragma once

#include "interface/Values.h"
#include "tools/collector/store/ReceivedRecords.h"

namespace orvanta::collector {

// The records as the JSON that readers of the collector's URLs get. Headers are pairs, in the order in which they stood
// on the wire. Bodies: as parsed JSON under "json", else as "text", else (no UTF-8) as "base64"; long ones only as
// "bodyURL".
Dictionary listRequest(const ReceivedRequest& request);
Dictionary listEvent(const ReceivedEvent& event);
Dictionary listDatagram(const ReceivedDatagram& datagram);
// A file upload: its name, description and numbers from the query, and where its bytes are.
Dictionary listUpload(const ReceivedRequest& request);
// A log-data upload: the archive as JSON.
Dictionary listLogData(const ReceivedRequest& request);

}  // namespace orvanta::collector
