#pragma once

// Everything a program needs to report through the daemon: connect with OrvantaConnection::connect(), then call its
// session(). docs/client.md shows how.

#include "client/BlockingCalls.h"
#include "client/CallResult.h"
#include "client/CallbackThread.h"
#include "client/ClientSession.h"
#include "client/OrvantaConnection.h"
#include "client/Records.h"
#include "interface/AggregatedEvent.h"
#include "interface/ClientSessionInterface.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaError.h"
#include "interface/Values.h"
