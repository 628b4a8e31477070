#pragma once

#include <memory>
#include <string>

#include "interface/Values.h"
#include "tools/collector/wire/Certificates.h"
#include "tools/collector/wire/Transport.h"

namespace orvanta::collector {

// The server side of TLS with one certificate. Immutable; accept() may be called from several threads.
class TlsServer {
 public:
  static Result<std::shared_ptr<TlsServer>> make(const ServerIdentity& identity);
  virtual ~TlsServer() = default;
  // Shakes hands. The stream is given back unusable (reads end at once) when the peer breaks off, so that the caller
  // can still interrupt it meanwhile.
  virtual std::unique_ptr<Transport> accept(platform::UniqueFd socket) = 0;
};

}  // namespace orvanta::collector
