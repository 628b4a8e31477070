// Asio's own code, compiled once for all sources.
#include <asio/impl/src.hpp>
