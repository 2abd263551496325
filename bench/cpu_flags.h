// The CPU flags that decide which kernels the benchmarks run (AVX-512, AVX2,
// FMA, ...), read from /proc/cpuinfo so that every figure is printed with them.
#pragma once

#include <fstream>
#include <sstream>
#include <string>

namespace reliqa::bench {

inline std::string cpuFlags() {
  std::ifstream cpuinfo("/proc/cpuinfo");
  std::string line;
  while (std::getline(cpuinfo, line)) {
    if (line.rfind("flags", 0) != 0 && line.rfind("Features", 0) != 0) continue;
    std::istringstream words(line.substr(line.find(':') + 1));
    std::string out, w;
    while (words >> w) {
      if (w == "avx2" || w == "avx512f" || w == "fma" || w == "sse4_2" || w == "bmi2" || w == "asimd" ||
          w == "neon") {
        out += (out.empty() ? "" : " ") + w;
      }
    }
    return out.empty() ? "none of avx512f avx2 fma sse4_2 bmi2 asimd neon" : out;
  }
  return "unknown";
}

}  // namespace reliqa::bench
