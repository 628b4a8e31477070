#include "bench/BenchDaemon.h"

#include <fstream>
#include <iterator>
#include <stdexcept>
#include <utility>

namespace orvanta::bench {

BenchDaemon::BenchDaemon(Dictionary section, bool consent, bool sandbox) {
  test::DaemonProcess::Options options;
  options.sandbox = sandbox;
  if (!section.empty()) {
    collector::CollectorOptions serving;
    serving.directory = _directory / "collector";
    auto started = collector::Collector::start(std::move(serving));
    if (!started) throw std::runtime_error(started.error());
    _collector = std::move(*started);
    _collector->setSection(std::move(section));
    options.storebagURL = _collector->storebagURL();
    std::ifstream key(_collector->publicKeyFile(), std::ios::binary);
    options.publicKey = {std::istreambuf_iterator<char>(key), {}};
  }
  options.device = {{"ProductVersion", "12.5"}, {"BuildVersion", "12F5"}, {"ProductType", "Parva3,2"},
                    {"DeviceName", "Parva"},    {"CountryCode", "DE"},    {"DiagnosticsSubmissionAllowed", consent}};
  options.logLevel = "4";
  _process = std::make_unique<test::DaemonProcess>(std::move(options));
  if (!_process->startQuietly()) {
    throw std::runtime_error("orvantad does not start: " + _process->process().allLines());
  }
}

Dictionary batchingSection(const PostSink& sink) {
  return {{"http_post", Dictionary{{"clients", Array{Dictionary{{"post_url", sink.url()},
                                                                {"locale_whitelist", Array{"DE"}},
                                                                {"filters", Array{}},
                                                                {"sampling_threshold", 1.0},
                                                                {"override_dnu", 1},
                                                                {"event_threshold", 49}}}}}}};
}

}  // namespace orvanta::bench
