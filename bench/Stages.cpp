#include "bench/Stages.h"

#include <arpa/inet.h>
#include <curl/curl.h>
#include <fmt/core.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <sys/socket.h>
#include <unistd.h>
#include <zlib.h>

#include <atomic>
#include <condition_variable>
#include <mutex>
#include <stdexcept>

#include "backends/BackendServices.h"
#include "backends/https/EventFilters.h"
#include "backends/https/EventRecord.h"
#include "backends/https/PostMessage.h"
#include "backends/https/SessionFields.h"
#include "bench/CallDriver.h"
#include "bench/RawPeers.h"
#include "config/Compression.h"
#include "interface/RemoteCalls.h"
#include "platform/codec/Json.h"
#include "tests/support/TestPlatform.h"

namespace orvanta::bench {

namespace {

constexpr double kSeconds = 1.0;
constexpr std::size_t kBatch = 50;

// Keeps the compiler from removing a result.
void consume(std::size_t value) {
  static std::atomic<std::size_t> sink{0};
  sink.store(value, std::memory_order_relaxed);
}

// Writes the fields of `record` straight into JSON: the least that any encoder has to do.
void appendFlat(std::string& out, const Dictionary& record) {
  out += '{';
  for (const auto& [key, value] : record) {
    platform::appendJsonString(out, key);
    out += ':';
    if (const auto* text = value.string()) {
      platform::appendJsonString(out, *text);
    } else if (const auto* real = std::get_if<double>(&value.storage())) {
      platform::appendJsonNumber(out, *real);
    } else {
      platform::appendJsonNumber(out, value.integerValue());
    }
    out += ',';
  }
  out.back() = '}';
}

double benchDecode() {
  const auto message = encodeCall("sendMessageWithDictionary",
                                  {Dictionary{{"category", 5}, {"type", 6}, {"payload", samplePayload(1)}}});
  const auto figure = measure(kSeconds, [&] {
    platform::FrameDecoder decoder(kFrameLimits);
    decoder.append(message);
    consume(std::get<platform::Frame>(decoder.next()).params.size());
    return 1;
  });
  printFigure(fmt::format("decode a call of {} bytes", message.size()), figure);
  return figure.cpuPerEvent;
}

// Bodies differ from each other as those of one session do: compressing the same one over and over would be quicker
// than the daemon's work.
constexpr std::size_t kBodies = 40;

struct Encoded {
  double raw = 0;
  std::vector<std::string> bodies;   // of kBatch records each
  std::vector<std::string> singles;  // of one
};

Encoded benchEncode(test::TestServices<BackendServices>& device) {
  BackendIdentity identity;
  identity.clientType = 5;
  identity.productFamily = "Parva";
  identity.productVersion = "12.5";
  identity.buildVersion = "12F5";
  identity.productType = "Parva3,2";
  identity.selfVersion = {8, 0, 0};
  identity.startTimestamp = device.clock.timeOfDay();
  const auto fields = SessionFields::of(identity, false);
  std::vector<SharedDictionary> payloads;
  for (std::uint32_t i = 0; i < kBodies * kBatch; ++i) {
    payloads.push_back(std::make_shared<const Dictionary>(samplePayload(i)));
  }
  const EventFilters filters;
  const auto build = [&](std::size_t first, std::size_t count) {
    std::vector<EventRecord> records;
    records.reserve(count);
    std::vector<OutgoingEvent> events(count);
    for (std::size_t i = 0; i < count; ++i) {
      Event event{payloads[first + i], {1'700'000'000, 250'000}, 5};
      event.number = static_cast<std::uint16_t>(first + i);
      event.time.microseconds += static_cast<std::int32_t>(first + i) * 37;
      records.emplace_back(fields, std::move(event), "AAAAAAAAAAAAAAAAAAAAAA==", 0);
      records.back().prepare(nullptr, filters);
      events[i].record = &records[i];
    }
    return createMessageForPostAndLogging(1'700'000'001.5 + static_cast<double>(first) * 37e-6,
                                          "0B7C2F9C-0000-0000-0000-000000000000", events, false)
        .json;
  };
  Encoded encoded;
  for (std::size_t i = 0; i < kBodies; ++i) {
    encoded.bodies.push_back(build(i * kBatch, kBatch));
    encoded.singles.push_back(build(i, 1));
  }

  const auto parsed = platform::parseJson(encoded.bodies[0]);
  const auto& flat = *(*parsed->dictionary()->find("events")->array())[0].dictionary();
  std::string out;
  const auto raw = measure(kSeconds, [&] {
    out.clear();
    for (std::size_t i = 0; i < kBatch; ++i) appendFlat(out, flat);
    consume(out.size());
    return kBatch;
  });
  const auto figure = measure(kSeconds, [&] {
    consume(build(0, kBatch).size());
    return kBatch;
  });
  printFigure(fmt::format("build and encode a record of {} bytes", encoded.bodies[0].size() / kBatch), figure);
  printRatio("  against encoding its fields alone", figure.cpuPerEvent, raw.cpuPerEvent, 2.0);
  encoded.raw = raw.cpuPerEvent;
  return encoded;
}

// Keeps one stream, so that no body pays for its set-up.
double rawGzip(const std::vector<std::string>& bodies) {
  z_stream stream{};
  if (::deflateInit2(&stream, -1, Z_DEFLATED, 31, 8, Z_DEFAULT_STRATEGY) != Z_OK) throw std::runtime_error("zlib");
  std::vector<Bytef> out(::deflateBound(&stream, bodies[0].size() + 1024));
  std::size_t turn = 0;
  const auto figure = measure(kSeconds, [&] {
    const std::string& body = bodies[turn++ % bodies.size()];
    ::deflateReset(&stream);
    stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(body.data()));
    stream.avail_in = static_cast<uInt>(body.size());
    stream.next_out = out.data();
    stream.avail_out = static_cast<uInt>(out.size());
    ::deflate(&stream, Z_FINISH);
    consume(stream.total_out);
    return 1;
  });
  ::deflateEnd(&stream);
  return figure.cpuPerEvent;
}

double benchGzip(const std::vector<std::string>& bodies, const char* name) {
  const double raw = rawGzip(bodies);
  std::size_t turn = 0;
  const auto figure = measure(kSeconds, [&] {
    consume(gzipDeflate(bodies[turn++ % bodies.size()])->size());
    return 1;
  });
  printFigure(fmt::format("gzip {} ({} bytes)", name, bodies[0].size()), figure);
  printRatio("  against zlib with a kept stream", figure.cpuPerEvent, raw, 1.1);
  return raw;
}

// Posts over one kept-alive connection with nothing but the HTTP library, one after the other.
double libraryPost(const PostSink& sink, const std::string& body) {
  CURL* const easy = curl_easy_init();
  const std::string url = sink.url();
  curl_easy_setopt(easy, CURLOPT_URL, url.c_str());
  curl_easy_setopt(easy, CURLOPT_NOSIGNAL, 1L);
  curl_easy_setopt(easy, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body.size()));
  curl_easy_setopt(easy, CURLOPT_POSTFIELDS, body.data());
  const auto figure = measure(kSeconds / 3, [&] {
    if (curl_easy_perform(easy) != CURLE_OK) throw std::runtime_error("the sink has gone");
    return 1;
  });
  curl_easy_cleanup(easy);
  return figure.cpuPerEvent;
}

// Posts over one kept-alive connection with nothing but the socket.
double rawPost(const PostSink& sink, const std::string& body) {
  const int fd = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(sink.port());
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  if (::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) throw std::runtime_error("connect");
  const std::string request = fmt::format(
      "POST /post HTTP/1.1\r\nHost: 127.0.0.1\r\nContent-Type: application/json\r\nContent-Length: {}\r\n\r\n{}",
      body.size(), body);
  char answer[256];
  const auto figure = measure(kSeconds / 3, [&] {
    if (::write(fd, request.data(), request.size()) < 0 || ::read(fd, answer, sizeof answer) <= 0) {
      throw std::runtime_error("the sink has gone");
    }
    return 1;
  });
  ::close(fd);
  return figure.cpuPerEvent;
}

// Several runs, since the processor that the sink happens to run on matters more than anything else here.
double medianOf(double (*post)(const PostSink&, const std::string&), const PostSink& sink, const std::string& body) {
  std::vector<double> figures;
  for (int i = 0; i < 5; ++i) figures.push_back(post(sink, body));
  return median(std::move(figures));
}

double benchPost(const std::string& body) {
  const PostSink sink;
  const double bare = medianOf(rawPost, sink, body);
  const double raw = medianOf(libraryPost, sink, body);
  platform::WorkPool pool(1);
  pool.start();
  const auto client = platform::makeCurlHttpClient(pool, {});
  const auto lane = client->makeLane();
  std::mutex mutex;
  std::condition_variable changed;
  std::size_t inFlight = 0;
  const auto figure = measure(kSeconds, [&] {
    std::unique_lock lock(mutex);
    changed.wait(lock, [&] { return inFlight < 16; });
    ++inFlight;
    lock.unlock();
    platform::HttpRequest request;
    request.method = "POST";
    request.url = sink.url();
    request.headers = {{"Content-Type", "application/json"}};
    request.body = body;
    request.discardResponseBody = true;
    client->start(lane, std::move(request), {}, [&](platform::HttpResult) {
      const std::lock_guard done(mutex);
      --inFlight;
      changed.notify_one();
    });
    return 1;
  });
  client->shutdown(std::chrono::milliseconds(2000));
  pool.stop();
  printFigure(fmt::format("post of {} bytes over one lane", body.size()), figure);
  printRatio("  against the library alone", figure.cpuPerEvent, raw, 2.0);
  fmt::print("    (the bare socket takes {:.3f} us)\n", bare);
  return raw;
}

}  // namespace

RawLimits benchStages() {
  printHeading("Stages");
  test::TestServices<BackendServices> device;
  RawLimits limits;
  limits.decode = benchDecode();
  const auto encoded = benchEncode(device);
  limits.encode = encoded.raw;
  limits.gzip = benchGzip(encoded.bodies, "a body of 50 records") / kBatch;
  limits.gzipSingle = benchGzip(encoded.singles, "a body of one record");
  limits.post = benchPost(*gzipDeflate(encoded.bodies[0]));
  benchMessageLog();
  return limits;
}

}  // namespace orvanta::bench
