// Statistics of one list of feature inputs, as the features define them.
//
// Every statistic of an empty list is -1.0. Of a non-empty list:
//   mean               sum in list order (double, from 0.0) / count
//   standardDeviation  population deviation: sqrt(sum((x - mean)^2) / count),
//                      integers converted to double before the subtraction
//   minimum, maximum   the first smallest / largest element (integers compared
//                      as integers); range = maximum - minimum
//   mode               (integer lists) the most frequent value; among equally
//                      frequent values the smallest
// NaN and infinities take part as arithmetic makes them.
//
// mode throws std::bad_alloc when maximum - minimum + 1 (computed in 64 bits)
// reaches 2^30: such a span is refused as if its histogram could not be
// allocated. Smaller spans need memory linear in the list, not in the span.
// Pure functions; any thread.
#pragma once

#include <cstdint>

#include "reliqaclassifier/ValueList.h"

namespace kestrova::reliqaclassifier {

double mean(const ValueList<double>& values);
double mean(const ValueList<int32_t>& values);

double standardDeviation(const ValueList<double>& values);
double standardDeviation(const ValueList<int32_t>& values);

// mean and standardDeviation together, the mean computed once.
struct MeanAndDeviation {
  double mean;
  double deviation;
};
MeanAndDeviation meanAndDeviation(const ValueList<double>& values);
MeanAndDeviation meanAndDeviation(const ValueList<int32_t>& values);

double minimum(const ValueList<double>& values);
double minimum(const ValueList<int32_t>& values);

double maximum(const ValueList<double>& values);
double maximum(const ValueList<int32_t>& values);

double range(const ValueList<double>& values);
double range(const ValueList<int32_t>& values);

double mode(const ValueList<int32_t>& values);

}  // namespace kestrova::reliqaclassifier
