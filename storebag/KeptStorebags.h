// The last good storebags, on disk, for a device that starts without a network.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "platform/result/Result.h"
#include "platform/time/Clock.h"
#include "storebag/SignedDocument.h"
#include "storebag/StorebagAcceptance.h"

namespace vesk {

/// One file for each storebag name, with the document as its server sent it, which is verified again whenever
/// it is read. Keeps no state in memory; waits for the disk. The agent's monitor makes sure that one thread
/// at a time uses a name.
class KeptStorebags {
 public:
  struct Kept {
    Dictionary payload;
    std::optional<std::string> lastModified;  ///< the server's date, for a conditional request
  };

  /// `publicKeys` is called for each verification. `acceptance` checks the optional signed keys, unless null.
  KeptStorebags(std::string directory, std::function<PublicKeys()> publicKeys,
                StorebagAcceptance* acceptance = nullptr)
      : _directory(std::move(directory)), _publicKeys(std::move(publicKeys)), _acceptance(acceptance) {}

  /// Replaces the kept document of that name. Logs a failure.
  void keep(std::string_view name, std::string_view document,
            const std::optional<std::string>& lastModified) const;

  /// The kept storebag of that name. A file that doesn't hold one that verifies is removed; one that is
  /// not accepted stays, but is not used. Either gives one line of level 3.
  std::optional<Kept> load(std::string_view name) const;

 private:
  std::string pathFor(std::string_view name) const;
  Result<Kept> parse(std::string_view file) const;

  const std::string _directory;
  const std::function<PublicKeys()> _publicKeys;
  StorebagAcceptance* const _acceptance;
};

}  // namespace vesk
