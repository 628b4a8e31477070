#include <fmt/format.h>

#include "config/MessageLog.h"
#include "interface/FileURL.h"
#include "interface/OrvantaLogging.h"
#include "session/OrvantadSession.h"

// Uploads of a client's file and of its log data: every backend is asked, one that takes it is enough.

namespace orvanta {

void OrvantadSession::uploadFileAtPath(std::string fileURL, std::optional<std::string> extensionToken,
                                       UploadReply completion) {
  const platform::BlockingScope blocking;  // a descriptor may take long to be looked at, and even to be closed
  ORVANTA_LOG(debug, "uploadFileAtPath: Uploading file for session {}", _sessionID);
  OrvantaBackend::UploadFile file;
  file.path = pathForFileURL(fileURL).value_or(fileURL);
  file.extensionToken = std::move(extensionToken);
  // The descriptor that came with the token: the only way to the file's content. Closed when this call ends.
  platform::UniqueFd descriptor;
  if (file.extensionToken && _connection) descriptor = _connection->takeDescriptor();
  file.descriptor = descriptor.get();
  file.removeFile = [this, token = file.extensionToken] {
    if (token && _client) _client->removeFile(*token);
  };

  bool uploaded = false;
  if (_backends) {
    for (const auto& [key, backend] : *_backends) uploaded = backend->uploadFileAtPath(file) || uploaded;
  }
  if (uploaded) {
    ORVANTA_LOG(debug, "uploadFileWithURL: File upload successful for {}", file.path);
  } else {
    ORVANTA_LOG(error, "uploadFileWithURL: File upload failed for {}", file.path);
  }
  writeToLogFile(_platform,
                 fmt::format("[uploadFileWithURL] Upload {} for file {}", uploaded ? "succeeded" : "failed", fileURL));
  completion(uploaded);
}

void OrvantadSession::uploadLogData(SharedArray logData, LogDataReply completion) {
  bool uploaded = false;
  if (_backends) {
    for (const auto& [key, backend] : *_backends) uploaded = backend->uploadLogData(logData) || uploaded;
  }
  if (uploaded) {
    ORVANTA_LOG(debug, "uploadLogData: Log data array upload successful");
  } else {
    ORVANTA_LOG(error, "uploadLogData: Log data array upload failed");
  }
  completion(uploaded, std::nullopt);
}

}  // namespace orvanta
