#pragma once

// Everything a program needs to report through the daemon: connect with OrvantaConnection::connect(), then call its
// session(). docs/client.md shows how.

#if __cplusplus <= 201703L
#error "liborvanta needs C++20 or later: compile with -std=c++20"
#endif

#include "client/BlockingCalls.h"
#include "client/CallbackThread.h"
#include "client/ClientSession.h"
#include "client/OrvantaConnection.h"
#include "client/Records.h"
#include "interface/ClientSessionInterface.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaError.h"
#include "interface/Reply.h"
#include "interface/Values.h"
#include "interface/WireLimits.h"
