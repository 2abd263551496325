// A line chart as a standalone SVG document: title, both axes with round tick
// values and labels, and the curve (with point markers when there are few
// points). Used for partial-dependence curves. Pure function; any thread.
#pragma once

#include <string>
#include <vector>

namespace reliqa::tool {

struct LineChart {
  std::string title;
  std::string xLabel;
  std::string yLabel;
  std::vector<double> x;  // ascending
  std::vector<double> y;  // same length as x, finite
};

std::string renderSvg(const LineChart& chart);

// Round tick positions covering [lo, hi], about `target` of them (1-2-5 steps).
std::vector<double> niceTicks(double lo, double hi, int target);

}  // namespace reliqa::tool
