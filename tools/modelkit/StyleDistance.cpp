#include "modelkit/StyleDistance.h"

#include <cmath>

namespace vora {
namespace modelkit {

double StyleDistance(const ColourStats& a, const ColourStats& b) {
    double chroma = 0.0;
    for (int i = 0; i < 2; ++i) chroma += std::pow(double(a.chromaMean[i]) - b.chromaMean[i], 2);
    double spread = 0.0;
    for (int i = 0; i < 4; ++i) spread += std::pow(double(a.chromaSqrtCov[i]) - b.chromaSqrtCov[i], 2);
    double tone = 0.0;
    for (int i = 0; i < 32; ++i) tone += std::pow(100.0 * (double(a.lightness[i]) - b.lightness[i]), 2);
    return chroma + spread / 2.0 + tone / 32.0;
}

}  // namespace modelkit
}  // namespace vora
