// What all sessions of the process share.
#pragma once

#include <string>

#include "backends/BackendServices.h"

namespace vesk {

/// Outlives the sessions.
struct SessionServices {
  BackendServices& backends;
  std::string libraryVersion;  ///< of the client library, "7.0" if it declares none
};

}  // namespace vesk
