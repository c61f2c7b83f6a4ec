#include "backends/BackendFactory.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>
#include <iterator>

#include "backends/dashboard/DashboardBackend.h"
#include "backends/https/HTTPSPostBackend.h"
#include "backends/kilnar/KilnarBackend.h"
#include "backends/upload/UploadBackend.h"
#include "backends/wren/WrenBackend.h"
#include "platform/log/SystemLog.h"
#include "util/ReportingdUtil.h"

namespace vesk {

namespace {

using Maker = std::shared_ptr<VeskReportingBackend> (*)(const std::string& name,
                                                        const std::optional<Dictionary>& profile,
                                                        const BackendIdentity& identity,
                                                        const BackendServices& services);

template <class Backend>
std::shared_ptr<VeskReportingBackend> make(const std::string& name, const std::optional<Dictionary>& profile,
                                           const BackendIdentity& identity, const BackendServices& services) {
  return Backend::create(name, profile, identity, services);
}

constexpr struct {
  std::string_view name;
  Maker make;
} kBackends[] = {{kVeskReportingBackendDashboard, make<DashboardBackend>},
                 {kVeskReportingBackendUploadServer, make<UploadBackend>},
                 {kVeskReportingBackendHTTPPost, make<HTTPSPostBackend>},
                 {kVeskReportingBackendHTTPPost2, make<HTTPSPostBackend>},
                 {kVeskReportingBackendKilnar, make<KilnarBackend>},
                 {kVeskReportingBackendWren, make<WrenBackend>}};

const auto* backendWithName(std::string_view name) {
  const bool hasNone = name == kVeskReportingBackendWren && deviceProductType() == Text::literal("Bramble");
  const auto* known = std::find_if(std::begin(kBackends), std::end(kBackends),
                                   [&](const auto& backend) { return backend.name == name; });
  return known == std::end(kBackends) || hasNone ? nullptr : known;
}

}  // namespace

bool isBackendName(std::string_view name) { return backendWithName(name) != nullptr; }

std::shared_ptr<VeskReportingBackend> newBackendWithName(const std::string& name,
                                                         const std::optional<Dictionary>& profile,
                                                         const BackendIdentity& identity,
                                                         const BackendServices& services) {
  if (const auto* known = backendWithName(name)) return known->make(name, profile, identity, services);
  VESK_LOG_ERROR("VeskReportingBackend(newBackendWithName): %s", name.c_str());
  return nullptr;
}

}  // namespace vesk
