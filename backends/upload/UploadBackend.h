#pragma once

#include <memory>
#include <optional>
#include <string>

#include "backends/OrvantaBackend.h"
#include "platform/listen/ExtensionTokens.h"

namespace orvanta {

// Sends a client's file, compressed, to an upload server, and has it deleted once the server confirms. Takes no events.
//
// Called on its session's queue, which an upload blocks until the server has answered. The file is read through the
// client's own open descriptor only: what it holds when the upload begins is what is sent.
class UploadBackend final : public OrvantaBackend {
  struct Made {};  // only the factory has one

 public:
  // Null, with a log line, when the profile has no "post_url".
  static std::shared_ptr<UploadBackend> create(BackendServices& services, std::string name, SharedDictionary profile,
                                               const BackendSetup& setup);
  UploadBackend(Made, BackendServices& services, std::string name, SharedDictionary profile, const BackendSetup& setup);

  // Returns whether the request was made, whatever came of it. A file above UploadBudget::kMaximumFileBytes is refused.
  bool uploadFileAtPath(const UploadFile& file) override;

  // Any thread.
  std::optional<std::string> uploadURL() const;
  void setUploadURL(std::optional<std::string> url);

 private:
  // The whole request; nullopt, with the reason in the log, when the upload must not be made.
  std::optional<platform::HttpRequest> makeRequest(const std::string& uploadURL, const UploadFile& file,
                                                   std::string body) const;
  static void handleAnswer(const std::string& uploadURL, const UploadFile& file, const platform::HttpResult& result);

  std::optional<std::string> _uploadURL GUARDED_BY(mutex());
};

}  // namespace orvanta
