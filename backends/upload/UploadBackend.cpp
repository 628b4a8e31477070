#include "backends/upload/UploadBackend.h"

#include <utility>

#include "backends/UploadBudget.h"
#include "backends/upload/UploadURL.h"
#include "config/Compression.h"
#include "config/StorebagKeys.h"
#include "interface/OrvantaLogging.h"
#include "interface/WireLimits.h"
#include "platform/core/Utf8.h"

namespace orvanta {

namespace {

// The most that is read. One byte beyond the bound tells a whole file from the start of one.
std::uint64_t bytesToRead(std::uint64_t size) {
  return size > 0 ? size : kMaximumUnsizedUploadBytes + 1;
}

std::optional<std::string> textAt(const SharedDictionary& dictionary, StorebagKey key) {
  const std::string* text = dictionary ? dictionary->text(nameOf(key)) : nullptr;
  return text == nullptr ? std::nullopt : std::optional(*text);
}

// The file's content, compressed; nullopt, with the reason in the log, when there is nothing to send.
std::optional<std::string> compressedContent(const platform::ExtensionHandle& handle, std::uint64_t size) {
  const platform::BlockingScope blocking;  // a slow file system, and seconds of compression
  const std::optional<std::string> content = handle.read(static_cast<std::size_t>(bytesToRead(size)));
  if (!content || content->empty()) {
    ORVANTA_LOG(error, "UploadBackend(uploadFileAtPath): Input file is empty");
    return std::nullopt;
  }
  if (size == 0 && content->size() > kMaximumUnsizedUploadBytes) {
    ORVANTA_LOG(error, "UploadBackend(uploadFileAtPath): The file does not tell its size and has more than {} bytes.",
                kMaximumUnsizedUploadBytes);
    return std::nullopt;
  }
  return gzipDeflate(*content);
}

}  // namespace

std::shared_ptr<UploadBackend> UploadBackend::create(BackendServices& services, std::string name,
                                                     SharedDictionary profile, const BackendSetup& setup) {
  std::optional<std::string> url = textAt(profile, StorebagKey::uploadPostURL);
  if (!url) {
    ORVANTA_LOG(error, "UploadBackend(initWithName): can't resolve upload post URL.");
    return nullptr;
  }
  auto backend = std::make_shared<UploadBackend>(Made{}, services, std::move(name), std::move(profile), setup);
  backend->setUploadURL(std::move(url));
  return backend;
}

UploadBackend::UploadBackend(Made, BackendServices& services, std::string name, SharedDictionary profile,
                             const BackendSetup& setup)
    : OrvantaBackend(services, std::move(name), std::move(profile), setup) {
  setDisplayURL(textAt(this->profile(), StorebagKey::uploadDisplayURL));
}

std::optional<std::string> UploadBackend::uploadURL() const {
  const platform::MutexLock lock(mutex());
  return _uploadURL;
}

void UploadBackend::setUploadURL(std::optional<std::string> url) {
  const platform::MutexLock lock(mutex());
  _uploadURL.swap(url);
}

bool UploadBackend::uploadFileAtPath(const UploadFile& file) {
  ORVANTA_LOG(debug, "UploadBackend(uploadFileAtPath): Uploading file {}", file.path);
  const std::optional<std::string> url = uploadURL();
  if (!url) return false;

  const auto handle = platform::ExtensionHandle::consume(file.extensionToken, file.descriptor);
  const std::optional<std::uint64_t> size = handle.regularFileSize();
  if (!size) {
    ORVANTA_LOG(error, "UploadBackend(uploadFileAtPath): Only upload a regular file.");
    return false;
  }
  if (*size > UploadBudget::kMaximumFileBytes) {
    ORVANTA_LOG(error, "UploadBackend(uploadFileAtPath): The file has {} bytes, more than the limit of {}.", *size,
                UploadBudget::kMaximumFileBytes);
    return false;
  }

  std::unique_ptr<UploadBudget::Reservation> reservation;
  {
    const platform::BlockingScope waitingForOthers;
    reservation = UploadBudget::Reservation::take(services().uploadBudget, UploadBudget::kCopies * bytesToRead(*size));
  }
  if (!reservation) {
    ORVANTA_LOG(error, "UploadBackend(uploadFileAtPath): The daemon is ending.");
    return false;
  }
  std::optional<std::string> body = compressedContent(handle, *size);
  if (!body) return false;
  reservation->shrinkTo(body->size());

  std::optional<platform::HttpRequest> request = makeRequest(*url, file, std::move(*body));
  if (!request) return false;
  // One request at a time, for which the caller waits; the memory it takes is in the budget.
  const auto lane = platform().http().makeLane(platform::HttpClient::LaneKind::unrefused);
  handleAnswer(*url, file, platform().http().perform(lane, std::move(*request)));
  return true;
}

std::optional<platform::HttpRequest> UploadBackend::makeRequest(const std::string& uploadURL, const UploadFile& file,
                                                                std::string body) const {
  platform::HttpRequest request;
  request.method = "POST";
  request.url = fileUploadURL(uploadURL, identity().deviceID, identity().sessionID, file.path);
  if (!isValidURL(request.url)) {
    ORVANTA_LOG(error, "UploadBackend(uploadFileAtPath): Unable to create URL request");
    return std::nullopt;
  }
  request.headers = {{"Content-Type", "application/octet-stream"}, {"Content-Encoding", "gzip"}};
  request.body = std::move(body);
  return request;
}

void UploadBackend::handleAnswer(const std::string& uploadURL, const UploadFile& file,
                                 const platform::HttpResult& result) {
  if (!result.response) {
    ORVANTA_LOG(error, "UploadBackend(uploadFileAtPath): post {}", result.error);
    return;
  }
  const std::string& body = result.response->body;
  const bool isText = platform::isValidUtf8(body);
  ORVANTA_LOG(debug, "UploadBackend(uploadFileAtPath): sending to |{}|, Json output: {}", uploadURL,
              isText ? std::string_view(body) : "(null)");
  if (isText && body.find("success") != std::string::npos && file.removeFile) file.removeFile();
}

}  // namespace orvanta
