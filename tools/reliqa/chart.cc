#include "tools/reliqa/chart.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdio>

namespace reliqa::tool {

namespace {

// Length of the UTF-8 sequence at s[i] if it is a well-formed character that
// XML may hold (not a control character, surrogate or noncharacter U+FFFE/F);
// 0 otherwise.
size_t xmlCharLength(const std::string& s, size_t i) {
  const auto byte = [&](size_t k) { return static_cast<unsigned char>(s[k]); };
  const unsigned char b = byte(i);
  if (b < 0x80) return b >= 0x20 || b == '\t' ? 1 : 0;
  size_t n = 0;
  uint32_t c = 0;
  if (b >= 0xC2 && b <= 0xDF) n = 2, c = b & 0x1Fu;
  else if (b >= 0xE0 && b <= 0xEF) n = 3, c = b & 0x0Fu;
  else if (b >= 0xF0 && b <= 0xF4) n = 4, c = b & 0x07u;
  else return 0;
  if (i + n > s.size()) return 0;
  for (size_t k = 1; k < n; ++k) {
    if ((byte(i + k) & 0xC0u) != 0x80u) return 0;
    c = (c << 6) | (byte(i + k) & 0x3Fu);
  }
  const uint32_t least[] = {0, 0, 0x80, 0x800, 0x10000};
  if (c < least[n] || c > 0x10FFFF || (c >= 0xD800 && c <= 0xDFFF) || c == 0xFFFE || c == 0xFFFF) return 0;
  return n;
}

std::string escapeXml(const std::string& s) {
  std::string out;
  for (size_t i = 0; i < s.size();) {
    const size_t n = xmlCharLength(s, i);
    if (n == 0) {
      out += "\xEF\xBF\xBD";  // U+FFFD
      ++i;
      continue;
    }
    switch (s[i]) {
      case '&': out += "&amp;"; break;
      case '<': out += "&lt;"; break;
      case '>': out += "&gt;"; break;
      case '"': out += "&quot;"; break;
      default: out.append(s, i, n);
    }
    i += n;
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

// A value beside a bar: four significant digits, with its sign if asked.
std::string shortValue(double v, bool sign) {
  char buf[48];
  std::snprintf(buf, sizeof buf, sign ? "%+.4g" : "%.4g", v == 0.0 ? 0.0 : v);
  return buf;
}

// The start of a chart of W x H pixels: the document, a white ground and the
// title, centred at the top.
std::string svgOpening(double W, double H, const std::string& title) {
  return "<svg xmlns=\"http://www.w3.org/2000/svg\" width=\"" + num(W) + "\" height=\"" + num(H) +
         "\" viewBox=\"0 0 " + num(W) + " " + num(H) + "\" font-family=\"sans-serif\">\n" +
         "<rect width=\"100%\" height=\"100%\" fill=\"white\"/>\n" + "<text x=\"" + num(W / 2) +
         "\" y=\"30\" text-anchor=\"middle\" font-size=\"17\" font-weight=\"bold\">" + escapeXml(title) +
         "</text>\n";
}

// Characters (not bytes) of a UTF-8 text, for estimating its width.
size_t characters(const std::string& s) {
  size_t n = 0;
  for (char c : s) n += (static_cast<unsigned char>(c) & 0xC0u) != 0x80u;
  return n;
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

  std::string s = svgOpening(W, H, c.title);

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

std::string renderSvg(const WaterfallChart& c) {
  struct Row {
    std::string label;
    double from, to;
    std::string fill;
    std::string text;
  };
  std::vector<Row> rows;
  rows.push_back({c.startLabel, 0.0, c.start, "#8a8f98", shortValue(c.start, false)});
  double sum = c.start;
  for (const WaterfallStep& step : c.steps) {
    rows.push_back({step.label, sum, sum + step.value, step.value > 0 ? "#c8402f" : "#1f5fa8",
                    shortValue(step.value, true)});
    sum += step.value;
  }
  rows.push_back({c.endLabel, 0.0, c.end, "#3b3f46", shortValue(c.end, false)});

  // Labels sit left of the plot in a column as wide as the longest one
  // (about 7 pixels a character at 13 pixels), within bounds.
  size_t longest = 0;
  for (const Row& r : rows) longest = std::max(longest, characters(r.label));
  const double labelWidth = std::clamp(static_cast<double>(longest) * 7.0 + 16.0, 110.0, 380.0);
  const double W = 960, rowHeight = 30, barHeight = 18, top = 78, right = 190;
  const double left = labelWidth + 16, pw = W - left - right;
  const double plotBottom = top + rowHeight * static_cast<double>(rows.size());
  const double H = plotBottom + 64;

  double lo = 0.0, hi = 0.0;
  for (const Row& r : rows) {
    lo = std::min({lo, r.from, r.to});
    hi = std::max({hi, r.from, r.to});
  }
  if (!(hi > lo)) hi = lo + 1.0;
  const double pad = (hi - lo) * 0.04;
  lo -= pad;
  hi += pad;
  auto px = [&](double x) { return left + (x - lo) / (hi - lo) * pw; };
  auto rowTop = [&](size_t i) { return top + rowHeight * static_cast<double>(i); };

  std::string s = svgOpening(W, H, c.title);
  s += "<text x=\"" + num(W / 2) + "\" y=\"52\" text-anchor=\"middle\" font-size=\"13\" fill=\"#555\">" +
       escapeXml(c.subtitle) + "</text>\n";

  // Grid, zero line and axis.
  std::vector<double> ticks = niceTicks(lo, hi, 8);
  const double step = ticks.size() > 1 ? ticks[1] - ticks[0] : 1;
  for (double t : ticks) {
    s += "<line x1=\"" + num(px(t)) + "\" y1=\"" + num(top) + "\" x2=\"" + num(px(t)) + "\" y2=\"" +
         num(plotBottom) + "\" stroke=\"#e4e4e4\"/>\n";
    s += "<text x=\"" + num(px(t)) + "\" y=\"" + num(plotBottom + 20) +
         "\" text-anchor=\"middle\" font-size=\"12\">" + tickLabel(t, step) + "</text>\n";
  }
  s += "<line x1=\"" + num(px(0)) + "\" y1=\"" + num(top) + "\" x2=\"" + num(px(0)) + "\" y2=\"" + num(plotBottom) +
       "\" stroke=\"#888\"/>\n";
  s += "<line x1=\"" + num(left) + "\" y1=\"" + num(plotBottom) + "\" x2=\"" + num(left + pw) + "\" y2=\"" +
       num(plotBottom) + "\" stroke=\"black\"/>\n";
  s += "<text x=\"" + num(left + pw / 2) + "\" y=\"" + num(plotBottom + 46) +
       "\" text-anchor=\"middle\" font-size=\"14\">" + escapeXml(c.axisLabel) + "</text>\n";

  // Bars, their labels and values, and the dashed joins between them.
  for (size_t i = 0; i < rows.size(); ++i) {
    const Row& r = rows[i];
    const double y = rowTop(i) + (rowHeight - barHeight) / 2;
    const double x0 = px(std::min(r.from, r.to)), x1 = px(std::max(r.from, r.to));
    s += "<rect x=\"" + num(x0) + "\" y=\"" + num(y) + "\" width=\"" + num(std::max(x1 - x0, 1.0)) +
         "\" height=\"" + num(barHeight) + "\" fill=\"" + r.fill + "\"/>\n";
    const bool bold = i == 0 || i + 1 == rows.size();
    s += "<text x=\"" + num(left - 10) + "\" y=\"" + num(y + 13) + "\" text-anchor=\"end\" font-size=\"13\"" +
         (bold ? " font-weight=\"bold\"" : "") + ">" + escapeXml(r.label) + "</text>\n";
    s += "<text x=\"" + num(std::max(x1, x0 + 1.0) + 6) + "\" y=\"" + num(y + 13) + "\" font-size=\"12\"" +
         (bold ? " font-weight=\"bold\"" : "") + ">" + escapeXml(r.text);
    if (i + 1 == rows.size() && !c.endNote.empty()) {
      s += "<tspan dx=\"12\">\xE2\x86\x92 " + escapeXml(c.endNote) + "</tspan>";  // an arrow
    }
    s += "</text>\n";
    if (i + 1 < rows.size()) {
      const double join = px(i + 2 == rows.size() ? c.end : r.to);
      s += "<line x1=\"" + num(join) + "\" y1=\"" + num(y + barHeight) + "\" x2=\"" + num(join) + "\" y2=\"" +
           num(y + rowHeight) + "\" stroke=\"#666\" stroke-dasharray=\"3 2\"/>\n";
    }
  }
  s += "</svg>\n";
  return s;
}

}  // namespace reliqa::tool
