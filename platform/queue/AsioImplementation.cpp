// Asio's own code, compiled once for everybody.
#include <asio/impl/src.hpp>
