// The report as metrics for a time-series monitor.
#ifndef PLATFORM_VVSTAT_METRICS_H
#define PLATFORM_VVSTAT_METRICS_H

#include <ctime>
#include <string>
#include <vector>

#include "vvstat/health.h"

namespace vvstat {

// The report in the text format of Prometheus, version 0.0.4 (prometheus.io, "Exposition formats"): a HELP
// and a TYPE line for each metric, then a line for each volume, or each target. Without an answer of the tree
// (`reachable` is false) there is remvol_tree_reachable alone, 0.
std::string metrics(bool reachable, const std::vector<Row>& rows, time_t now);

}  // namespace vvstat

#endif
