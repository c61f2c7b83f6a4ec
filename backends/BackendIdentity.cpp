#include "backends/BackendIdentity.h"

#include "values/Conversions.h"

namespace vesk {

namespace {

std::uint8_t versionPiece(std::string_view piece) { return static_cast<std::uint8_t>(leadingInteger(piece)); }

}  // namespace

void BackendIdentity::setSelfVersion(std::string_view version) {
  const auto dot = version.find('.');
  _selfVersionMajor = versionPiece(version.substr(0, dot));
  _selfVersionMinor = dot == std::string_view::npos ? 0 : versionPiece(version.substr(dot + 1));
}

}  // namespace vesk
