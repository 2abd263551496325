// Charts as standalone SVG documents (no scripts, no external fonts or
// styles). Pure functions; any thread. Text is escaped for XML; bytes that
// are not UTF-8, and control characters, show as U+FFFD.
//
// A line chart: title, both axes with round tick values and labels, and the
// curve (with point markers when there are few points). Used for
// partial-dependence curves.
//
// A waterfall chart: one horizontal bar per row, top to bottom. The first
// row is the start (a bar from 0 to `start`), each step a bar from the
// running sum to the running sum plus its value (red when it raises the sum,
// blue when it lowers it), and the last row the end (a bar from 0 to `end`,
// with `endNote` beside its value). Dashed lines join each bar's end to the
// next bar's start. Used for the contributions of features to a raw score.
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

struct WaterfallStep {
  std::string label;
  double value = 0.0;  // finite
};

struct WaterfallChart {
  std::string title;
  std::string subtitle;
  std::string axisLabel;
  std::string startLabel;
  double start = 0.0;  // finite
  std::vector<WaterfallStep> steps;
  std::string endLabel;
  double end = 0.0;  // finite; start plus the steps, up to rounding
  std::string endNote;
};

std::string renderSvg(const WaterfallChart& chart);

// Round tick positions covering [lo, hi], about `target` of them (1-2-5 steps).
std::vector<double> niceTicks(double lo, double hi, int target);

}  // namespace reliqa::tool
