#include "backends/https/PostQueue.h"

#include <fmt/format.h>

#include <utility>

#include "config/Compression.h"
#include "config/Platform.h"
#include "interface/OrvantaLogging.h"

namespace orvanta {
namespace {

constexpr int kLocalFailure = -1;

bool isServerError(int status) {
  return status >= 500 && status <= 599;
}

}  // namespace

// Ends the post. Shared by the two callbacks of the request; if both are dropped uncalled, the completion hears of
// that.
class PostQueue::Outcome {
 public:
  Outcome(std::weak_ptr<OrvantaBackend> backend, std::string backendName, PostCompletion completion)
      : _backend(std::move(backend)), _backendName(std::move(backendName)), _completion(std::move(completion)) {}
  Outcome(const Outcome&) = delete;
  Outcome& operator=(const Outcome&) = delete;
  ~Outcome() {
    if (_completion) complete(makeOrvantaError("the post was dropped", kLocalFailure));
  }

  // On the HTTP client's thread. Returns whether finish() has anything to do: most posts are taken and have no
  // completion. finish() releases the backend, whose last reference this may be.
  bool observe(const platform::HttpResult& result) {
    if (!result.response) return true;
    if (!isServerError(result.response->status)) return static_cast<bool>(_completion);
    _kept = _backend.lock();
    if (_kept) _kept->setState(kBackendDisabled);
    return true;
  }

  void finish(const platform::HttpResult& result) {
    _kept.reset();
    std::optional<OrvantaError> error;
    if (!result.response) {
      ORVANTA_LOG(error, "HTTPSPostBackend(postJsonMessage): post error: {}", result.error);
      error = makeOrvantaError(result.error, kLocalFailure);
    } else if (isServerError(result.response->status)) {
      const int status = result.response->status;
      std::string text = fmt::format("backend {} disabled by server {} return code", _backendName, status);
      ORVANTA_LOG(info, "postJSONMessage: {}", text);
      error = makeOrvantaError(std::move(text), status);
    }
    complete(std::move(error));
  }

 private:
  void complete(std::optional<OrvantaError> error) {
    auto completion = std::move(_completion);
    if (completion) completion(std::move(error));
  }

  const std::weak_ptr<OrvantaBackend> _backend;
  const std::string _backendName;
  PostCompletion _completion;
  std::shared_ptr<OrvantaBackend> _kept;
};

PostQueue::PostQueue(BackendServices& services, std::weak_ptr<OrvantaBackend> backend, std::string backendName)
    : _http(services.platform().http()),
      _pendingPosts(services.pendingPosts),
      _backend(std::move(backend)),
      _backendName(std::move(backendName)),
      _queue(services.platform().pool().makeComputeQueue()),
      _lane(_http.makeLane()) {}

// A post that waits to be compressed.
struct PostQueue::Job {
  std::shared_ptr<PostQueue> queue;
  Post post;
  std::shared_ptr<Outcome> outcome;
  // Also until the pool drops the job, which it may do after the services have gone.
  std::unique_ptr<PendingPosts::Reservation> reservation;
};

void PostQueue::post(Post post) {
  auto outcome = std::make_shared<Outcome>(_backend, _backendName, std::move(post.completion));
  auto reservation = PendingPosts::Reservation::take(_pendingPosts, _share, post.json.size());
  if (!reservation) {
    outcome->finish({std::nullopt, "too much waits to be posted already"});
    return;
  }
  auto job =
      std::make_unique<Job>(Job{shared_from_this(), std::move(post), std::move(outcome), std::move(reservation)});
  _queue->post([job = std::move(job)] { job->queue->compressAndStart(*job); });
}

void PostQueue::compressAndStart(Job& job) {
  const std::size_t size = job.post.json.size();
  platform::HttpRequest request;
  request.method = "POST";
  request.url = std::move(job.post.url);
  request.headers = std::move(job.post.headers);
  request.discardResponseBody = true;
  auto compressed = gzipDeflate(job.post.json);
  const bool smaller = compressed && !compressed->empty() && compressed->size() < size;
  request.body = smaller ? std::move(*compressed) : std::move(job.post.json);
  request.headers.push_back({"Content-Length", std::to_string(request.body.size())});
  if (smaller) request.headers.push_back({"Content-Encoding", "gzip"});
  std::string().swap(job.post.json);
  job.reservation->giveRoomBack();
  _http.start(
      _lane, std::move(request),
      [outcome = job.outcome](const platform::HttpResult& result) { return outcome->observe(result); },
      [outcome = job.outcome](const platform::HttpResult& result) { outcome->finish(result); });
}

}  // namespace orvanta
