#include "transfer/SolveTransfer.h"

#include <algorithm>
#include <cmath>

namespace vora {

namespace {

constexpr int kSamples = 32;

// A read-only 2x2 from four row-major record floats. Cloned: a matrix
// expression assigned to a header over the record would write into it.
cv::Mat Matrix2x2(const float* values) {
    return cv::Mat(2, 2, CV_32F, const_cast<float*>(values)).clone();
}

// f(x) = (atan((x - a)/w) + atan(a/w)) / (atan(a/w) + atan((1 - a)/w)),
// which maps 0 to 0 and 1 to 1. The two x-independent arctangents are taken
// once per grid point.
class ArctanCurve {
public:
    ArctanCurve(float centre, float width)
        : m_centre(centre), m_width(width), m_offset(atanf(centre / width)),
          m_denominator(m_offset + atanf((1.0f - centre) / width)) {}

    float operator()(float x) const { return (atanf((x - m_centre) / m_width) + m_offset) / m_denominator; }

private:
    float m_centre;
    float m_width;
    float m_offset;
    float m_denominator;
};

// Squared error summed in index order, in float.
float FitError(const ArctanCurve& curve, const float* content, const float* targets) {
    float error = 0.0f;
#pragma GCC unroll 32
    for (int i = 0; i < kSamples; ++i) {
        const float residual = targets[i] - curve(content[i]);
        error += residual * residual;
    }
    return error;
}

// The grids step by repeated float addition and the results depend on it:
// the coarse sums reach 0.70000005 and 1.0000001, so the nominal end points
// a = 0.7 and w = 1.0 are never tried (7 x 8 points).
template <typename Visit>
void ForEachCoarsePoint(Visit&& visit) {
    for (float a = 0.0f; a <= 0.7f; a += 0.1f) {
        for (float w = 0.2f; w <= 1.0f; w += 0.1f) visit(a, w);
    }
}

// 10 or 11 points per axis around (a0, w0), as the float sums fall.
template <typename Visit>
void ForEachFinePoint(float a0, float w0, Visit&& visit) {
    const float aEnd = a0 + 0.1f;
    const float wBegin = w0 - 0.1f;
    const float wEnd = w0 + 0.1f;
    for (float a = a0 - 0.1f; a <= aEnd; a += 0.02f) {
        for (float w = wBegin; w <= wEnd; w += 0.02f) visit(a, w);
    }
}

// Strict comparison: ties keep the earlier point. If no error ever falls
// below the start value (NaN errors), the pair stays (0, 0).
struct BestFit {
    float error = 1e10f;
    float centre = 0.0f;
    float width = 0.0f;

    void Consider(float a, float w, const float* content, const float* targets) {
        const float e = FitError(ArctanCurve(a, w), content, targets);
        if (e < error) {
            error = e;
            centre = a;
            width = w;
        }
    }
};

}  // namespace

void ToneTargets(const ColourStats& content, const ColourStats& style, const VoraParameters& params,
                 float targets[32]) {
    const float* c = content.lightness;
    const float* s = style.lightness;
    float largest = 0.0f;
    for (int i = 0; i < kSamples; ++i) largest = std::max(largest, std::fabs(s[i] - c[i]));
    // The threshold scales with limitFactor but the limited move is always 0.2.
    if (largest > params.limitFactor * 0.2f) {
        for (int i = 0; i < kSamples; ++i) targets[i] = c[i] + (s[i] - c[i]) / largest * 0.2f;
    } else {
        for (int i = 0; i < kSamples; ++i) targets[i] = s[i];
    }
}

std::vector<ToneGridPoint> ToneCoarseGrid() {
    std::vector<ToneGridPoint> points;
    ForEachCoarsePoint([&](float a, float w) { points.push_back({a, w}); });
    return points;
}

int FitToneCurve(const ColourStats& content, const ColourStats& style, TRANSFER& transfer,
                 const VoraParameters& params) {
    float targets[kSamples];
    ToneTargets(content, style, params, targets);
    const float* c = content.lightness;

    BestFit coarse;
    ForEachCoarsePoint([&](float a, float w) { coarse.Consider(a, w, c, targets); });
    // The fine search starts again from 1e10, not from the coarse error.
    BestFit fine;
    ForEachFinePoint(coarse.centre, coarse.width, [&](float a, float w) { fine.Consider(a, w, c, targets); });

    const ArctanCurve curve(fine.centre, fine.width);
    transfer.toneCurve[0] = 0.0f;
    for (int i = 1; i < 255; ++i) {
        const float x = static_cast<float>(i / 255.0);
        transfer.toneCurve[i] = std::min(1.0f, std::max(0.0f, curve(x)));
    }
    transfer.toneCurve[255] = 1.0f;
    transfer.toneCurve[256] = 1.0f;  // guard: apply reads it with weight 0 at t = 1
    return 0;
}

int SolveTransfer(const ColourStats& content, const ColourStats& style, TRANSFER& transfer,
                  const VoraParameters& params) {
    const float floorValue = static_cast<float>(params.solveFactor * 15.0);
    const cv::Mat floorMatrix = (cv::Mat_<float>(2, 2) << floorValue, 0.0f, 0.0f, floorValue);

    // The floor acts on all four entries, so a negative off-diagonal entry
    // becomes 0; it is not an eigenvalue floor.
    cv::Mat sc = cv::max(Matrix2x2(content.chromaSqrtCov), floorMatrix);
    // Inverted once into its own matrix: written inline in the product, OpenCV
    // would turn it into a solve, which rounds differently. A singular Sc
    // gives a zero inverse and hence a zero map.
    const cv::Mat scInv = sc.inv(cv::DECOMP_LU);

    const cv::Mat ss = Matrix2x2(style.chromaSqrtCov);
    const cv::MatExpr cs = ss.t() * ss;
    cv::Mat b;
    MatrixSqrt(sc * cs * sc, b);
    const cv::Mat t = scInv * b * scInv;

    transfer.contentMean[0] = content.chromaMean[0];
    transfer.contentMean[1] = content.chromaMean[1];
    transfer.styleMean[0] = style.chromaMean[0];
    transfer.styleMean[1] = style.chromaMean[1];
    for (int i = 0; i < 4; ++i) transfer.chromaMatrix[i] = t.at<float>(i / 2, i % 2);

    FitToneCurve(content, style, transfer, params);

    // The style's own percentile points are not used.
    transfer.lightnessLow = content.lightnessLow;
    transfer.lightnessHigh = content.lightnessHigh;
    return 0;
}

}  // namespace vora
