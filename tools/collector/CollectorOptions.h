#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>

#include "tools/collector/servers/StorebagServer.h"
#include "tools/collector/store/Inbox.h"
#include "tools/collector/wire/Certificates.h"

namespace orvanta::collector {

struct CollectorOptions {
  // Holds keys, certificates, bags and the database; made when it does not exist.
  std::string directory;
  std::string address = "127.0.0.1";
  // 0 takes any free port.
  std::uint16_t httpPort = 0;
  std::uint16_t httpsPort = 0;
  std::uint16_t dashboardPort = 0;
  CertificateFlaw certificateFlaw = CertificateFlaw::none;
  StorebagSettings storebag;
  InboxLimits inbox;
  std::size_t maximumBodyBytes = 64U << 20U;  // of one request; longer ones are answered 413
  // Sees each recorded request, on the collector's threads; may be empty.
  std::function<void(const ReceivedRequest&)> observer;
};

}  // namespace orvanta::collector
