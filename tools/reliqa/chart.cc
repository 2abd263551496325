#include "tools/reliqa/chart.h"

#include <algorithm>
#include <cmath>
#include <cstdio>

namespace reliqa::tool {

namespace {

std::string escapeXml(const std::string& s) {
  std::string out;
  for (char c : s) {
    switch (c) {
      case '&': out += "&amp;"; break;
      case '<': out += "&lt;"; break;
      case '>': out += "&gt;"; break;
      case '"': out += "&quot;"; break;
      default: out += c;
    }
  }
  return out;
}

std::string num(double v) {
  char buf[32];
  std::snprintf(buf, sizeof buf, "%.2f", v);
  return buf;
}

// Tick label: as few digits as tell neighbouring ticks apart.
std::string tickLabel(double v, double step) {
  if (std::fabs(v) < step * 1e-9) v = 0.0;
  int decimals = std::max(0, -static_cast<int>(std::floor(std::log10(step) + 1e-9)));
  char buf[48];
  if (std::fabs(v) >= 1e6 || (v != 0.0 && std::fabs(v) < 1e-4)) {
    std::snprintf(buf, sizeof buf, "%.3g", v);
  } else {
    std::snprintf(buf, sizeof buf, "%.*f", std::min(decimals, 10), v);
  }
  return buf;
}

}  // namespace

std::vector<double> niceTicks(double lo, double hi, int target) {
  if (!(hi > lo)) return {lo};
  double raw = (hi - lo) / std::max(1, target);
  double mag = std::pow(10.0, std::floor(std::log10(raw)));
  double step = mag;
  for (double m : {1.0, 2.0, 5.0, 10.0}) {
    step = m * mag;
    if (step >= raw) break;
  }
  std::vector<double> ticks;
  for (double t = std::ceil(lo / step - 1e-9) * step; t <= hi + step * 1e-9 && ticks.size() < 100; t += step) {
    ticks.push_back(t);
  }
  return ticks;
}

std::string renderSvg(const LineChart& c) {
  const double W = 760, H = 460, left = 86, right = 24, top = 52, bottom = 70;
  const double pw = W - left - right, ph = H - top - bottom;
  double xlo = c.x.empty() ? 0 : c.x.front(), xhi = c.x.empty() ? 1 : c.x.back();
  if (!(xhi > xlo)) xhi = xlo + 1;
  double ylo = c.y.empty() ? 0 : *std::min_element(c.y.begin(), c.y.end());
  double yhi = c.y.empty() ? 1 : *std::max_element(c.y.begin(), c.y.end());
  if (!(yhi > ylo)) {  // a flat curve: give it some room
    double pad = std::max(std::fabs(ylo) * 0.1, 0.1);
    ylo -= pad;
    yhi += pad;
  } else {
    double pad = (yhi - ylo) * 0.06;
    ylo -= pad;
    yhi += pad;
  }
  auto px = [&](double x) { return left + (x - xlo) / (xhi - xlo) * pw; };
  auto py = [&](double y) { return top + (1.0 - (y - ylo) / (yhi - ylo)) * ph; };

  std::string s;
  s += "<svg xmlns=\"http://www.w3.org/2000/svg\" width=\"" + num(W) + "\" height=\"" + num(H) +
       "\" viewBox=\"0 0 " + num(W) + " " + num(H) + "\" font-family=\"sans-serif\">\n";
  s += "<rect width=\"100%\" height=\"100%\" fill=\"white\"/>\n";
  s += "<text x=\"" + num(W / 2) + "\" y=\"30\" text-anchor=\"middle\" font-size=\"17\" font-weight=\"bold\">" +
       escapeXml(c.title) + "</text>\n";

  // Grid and ticks.
  std::vector<double> xt = niceTicks(xlo, xhi, 8), yt = niceTicks(ylo, yhi, 6);
  double xstep = xt.size() > 1 ? xt[1] - xt[0] : 1, ystep = yt.size() > 1 ? yt[1] - yt[0] : 1;
  for (double t : xt) {
    s += "<line x1=\"" + num(px(t)) + "\" y1=\"" + num(top) + "\" x2=\"" + num(px(t)) + "\" y2=\"" +
         num(top + ph) + "\" stroke=\"#e4e4e4\"/>\n";
    s += "<text x=\"" + num(px(t)) + "\" y=\"" + num(top + ph + 20) +
         "\" text-anchor=\"middle\" font-size=\"12\">" + tickLabel(t, xstep) + "</text>\n";
  }
  for (double t : yt) {
    s += "<line x1=\"" + num(left) + "\" y1=\"" + num(py(t)) + "\" x2=\"" + num(left + pw) + "\" y2=\"" +
         num(py(t)) + "\" stroke=\"#e4e4e4\"/>\n";
    s += "<text x=\"" + num(left - 8) + "\" y=\"" + num(py(t) + 4) + "\" text-anchor=\"end\" font-size=\"12\">" +
         tickLabel(t, ystep) + "</text>\n";
  }
  // Axes.
  s += "<line x1=\"" + num(left) + "\" y1=\"" + num(top + ph) + "\" x2=\"" + num(left + pw) + "\" y2=\"" +
       num(top + ph) + "\" stroke=\"black\"/>\n";
  s += "<line x1=\"" + num(left) + "\" y1=\"" + num(top) + "\" x2=\"" + num(left) + "\" y2=\"" + num(top + ph) +
       "\" stroke=\"black\"/>\n";
  s += "<text x=\"" + num(left + pw / 2) + "\" y=\"" + num(H - 22) + "\" text-anchor=\"middle\" font-size=\"14\">" +
       escapeXml(c.xLabel) + "</text>\n";
  s += "<text transform=\"translate(22 " + num(top + ph / 2) +
       ") rotate(-90)\" text-anchor=\"middle\" font-size=\"14\">" + escapeXml(c.yLabel) + "</text>\n";

  // The curve.
  if (!c.x.empty()) {
    s += "<polyline fill=\"none\" stroke=\"#1f5fa8\" stroke-width=\"2\" points=\"";
    for (size_t i = 0; i < c.x.size(); ++i) {
      if (i) s += ' ';
      s += num(px(c.x[i])) + "," + num(py(c.y[i]));
    }
    s += "\"/>\n";
    if (c.x.size() <= 60) {
      for (size_t i = 0; i < c.x.size(); ++i) {
        s += "<circle cx=\"" + num(px(c.x[i])) + "\" cy=\"" + num(py(c.y[i])) + "\" r=\"2.5\" fill=\"#1f5fa8\"/>\n";
      }
    }
  }
  s += "</svg>\n";
  return s;
}

}  // namespace reliqa::tool
