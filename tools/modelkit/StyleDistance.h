#pragma once

// The distance the builder stores between two styles, chosen so that its
// square root reads in Lab units, like a colour difference:
//
//   d = (da*)^2 + (db*)^2                      chroma means
//     + |dC|^2 / 2                             square-root covariances C (Frobenius),
//                                              halved: for C = s I it is (ds)^2
//     + sum_i (100 dl_i)^2 / 32                lightness samples on the L* scale, mean square
//
// Each of the three terms is the square of a typical difference in a*, b* or
// L* units, so sqrt(d) >= 15 (the library's default diversity threshold)
// means treatments that differ visibly in cast, in colourfulness or in tone.

#include "transfer/ColourStatistics.h"

namespace vora {
namespace modelkit {

double StyleDistance(const ColourStats& a, const ColourStats& b);

}  // namespace modelkit
}  // namespace vora
