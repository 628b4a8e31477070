#include <fmt/core.h>

#include <chrono>
#include <stdexcept>
#include <thread>

#include "bench/BenchDaemon.h"
#include "bench/CallDriver.h"
#include "bench/RawPeers.h"
#include "bench/Stages.h"
#include "interface/RemoteCalls.h"

namespace orvanta::bench {

namespace {

constexpr std::uint64_t kWindow = 64;

constexpr std::uint64_t kChunk = 320;
constexpr std::uint64_t kInFlight = 3200;

void awaitPosts(const PostSink& sink, std::uint64_t wanted) {
  const auto begun = std::chrono::steady_clock::now();
  while (sink.posts() < wanted) {
    if (std::chrono::steady_clock::now() - begun > std::chrono::seconds(30)) {
      throw std::runtime_error(fmt::format("only {} of {} posts arrived", sink.posts(), wanted));
    }
    std::this_thread::sleep_for(std::chrono::microseconds(50));
  }
}

// Round trips of a session whose events are batched: every fiftieth one makes a post, which is built, compressed and
// sent beside the next calls.
void benchLatencyBesidePosts() {
  const PostSink sink;
  const BenchDaemon daemon(batchingSection(sink), false);
  CallDriver driver(daemon.process().socketPath());
  driver.configure(true);
  const auto trips = driver.roundTrips(sampleCall(), kNilAnswer, 20'000);
  printRatio("  and while batches are posted", percentile(trips, 0.99), median(trips), 3.0);
}

}  // namespace

void benchCallPath() {
  printHeading("Call and reply, no backend");
  const BenchDaemon daemon;
  const auto call = sampleCall();
  constexpr std::uint64_t kCalls = 400'000;

  const std::string echoPath = daemon.process().runtimeDirectory() + "/echo";
  const EchoServer echo(echoPath, call.size(), kNilAnswer);
  CallDriver echoDriver(echoPath);
  const auto burst = repeated(call, kWindow);
  const Stretch echoTime(echo.pid());
  echoDriver.pipeline(burst, kNilAnswer, kCalls, kWindow);
  const double echoCpu = figureOf(echoTime, kCalls).cpuPerEvent;
  const auto decode = measure(0.5, [&] {
    platform::FrameDecoder decoder(kFrameLimits);
    decoder.append(call);
    return std::get<platform::Frame>(decoder.next()).params.size();
  });

  CallDriver driver(daemon.process().socketPath());
  const Stretch time(daemon.process().process().pid());
  driver.pipeline(burst, kNilAnswer, kCalls, kWindow);
  const auto figure = figureOf(time, kCalls);
  printFigure(fmt::format("pipelined {} deep, {} bytes each, daemon's CPU", kWindow, call.size()), figure);
  printRatio("  against echo and decode", figure.cpuPerEvent, echoCpu + decode.cpuPerEvent, 1.5);

  constexpr std::uint64_t kRoundTrips = 20'000;
  const auto echoTrips = echoDriver.roundTrips(call, kNilAnswer, kRoundTrips);
  const auto trips = driver.roundTrips(call, kNilAnswer, kRoundTrips);
  printRatio("one at a time, median, against echo", median(trips), median(echoTrips), 1.6);
  printRatio("one at a time, p99, against the median", percentile(trips, 0.99), median(trips), 3.0);
  benchLatencyBesidePosts();
  fmt::print("  {:<58} {:>9} KiB (goal 9216 KiB)\n", "resident memory", daemon.process().residentKiB());
}

void benchWholePath(const RawLimits& limits) {
  printHeading("Whole path: client, daemon, gzip JSON, post, local sink");
  const PostSink sink;
  // Without consent no answer carries the text of what was sent, so that every answer has one size.
  const BenchDaemon daemon(batchingSection(sink), false);

  for (const bool batched : {true, false}) {
    CallDriver driver(daemon.process().socketPath());
    driver.configure(batched);
    const auto burst = encodeEvents(kWindow);
    const std::uint64_t events = batched ? 200'000 : 20'000;
    const auto postsBefore = sink.posts();
    const Stretch time(daemon.process().process().pid());
    const std::uint64_t perPost = batched ? 50 : 1;
    // A lane holds a limited number of posts, and refuses more to a client that calls faster than they are answered.
    for (std::uint64_t sent = 0; sent < events; sent += kChunk) {
      driver.pipeline(burst, kNilAnswer, kChunk, kWindow);
      awaitPosts(sink, postsBefore + (sent < kInFlight ? 0 : (sent - kInFlight) / perPost));
    }
    driver.call(encodeCall("flushMessagesWithCompletion", {}));
    // The daemon has taken every event; the posts still to come count as well.
    awaitPosts(sink, postsBefore + events / perPost);
    const auto figure = figureOf(time, events);
    const double raw = batched ? limits.decode + limits.encode + limits.gzip + limits.post / 50
                               : limits.decode + limits.encode + limits.gzipSingle + limits.post;
    printFigure(batched ? "batched, 50 a post, daemon's CPU" : "one post each, daemon's CPU", figure);
    printRatio("  against the sum of the raw limits", figure.cpuPerEvent, raw, batched ? 1.25 : 2.0);
  }
}

}  // namespace orvanta::bench
