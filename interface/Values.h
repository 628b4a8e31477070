#pragma once

#include "platform/core/Result.h"
#include "platform/core/Value.h"

namespace orvanta {

// The platform layer's words that everything above it uses daily, here without the layer's name.
using platform::Array;
using platform::Dictionary;
using platform::Failure;
using platform::Result;
using platform::SharedArray;
using platform::SharedDictionary;
using platform::Value;

}  // namespace orvanta
