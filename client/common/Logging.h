// The client library's logging start, which the daemon uses too.
#pragma once

#include <VeskReporting/VeskReportingLogging.h>
