#include "storebag/StorebagFallback.h"

namespace vesk {

Dictionary fallbackStorebag() {
  const Dictionary section{{"wren", Dictionary{{"active", true}}}};
  return {{"corvane_internal", section},
          {"development", section},
          {"release", section},
          {"version", "1.0.0-Palvo-Fallback"},
          {"refresh_cycle", 3600}};
}

}  // namespace vesk
