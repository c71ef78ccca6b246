#include "transfer/ColourStatistics.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>

#include "color/ColorConversion.h"

namespace vora {

void ConvertToLab(const cv::Mat& bgr8, cv::Mat& lab) {
    if (bgr8.rows < 1) return;
    CV_Assert(bgr8.type() == CV_8UC3 && lab.type() == CV_32FC3 && lab.size() == bgr8.size());

    const int columns = bgr8.cols;
    for (int row = 0; row < bgr8.rows; ++row) {
        const uint8_t* in = bgr8.ptr<uint8_t>(row);
        float* out = lab.ptr<float>(row);
        for (int c = 0; c < columns; ++c, in += 3, out += 3) {
            // Bytes are B, G, R; the conversion takes R, G, B.
            const LabPixel pixel = RgbToLab(in[2], in[1], in[0]);
            out[0] = pixel.lightness01;
            out[1] = pixel.a;
            out[2] = pixel.b;
        }
    }
}

int ComputeChromaStats(const cv::Mat& lab, ColourStats& stats) {
    const int pixels = lab.rows * lab.cols;
    const cv::Mat chroma = lab.reshape(1, pixels).colRange(1, 3);

    cv::Mat covariance;
    cv::Mat mean;
    cv::calcCovarMatrix(chroma, covariance, mean, cv::COVAR_NORMAL | cv::COVAR_SCALE | cv::COVAR_ROWS, CV_32F);
    stats.chromaMean[0] = mean.at<float>(0, 0);
    stats.chromaMean[1] = mean.at<float>(0, 1);

    cv::Mat root;
    MatrixSqrt(covariance, root);
    for (int i = 0; i < 4; ++i) stats.chromaSqrtCov[i] = root.at<float>(i / 2, i % 2);
    return 0;
}

int ComputeLightnessStats(const cv::Mat& lab, ColourStats& stats) {
    const int pixels = lab.rows * lab.cols;
    const cv::Mat lightness = lab.reshape(1, pixels).col(0);

    cv::Mat sorted;
    cv::sort(lightness, sorted, cv::SORT_EVERY_COLUMN | cv::SORT_ASCENDING);
    float* s = sorted.ptr<float>();
    const size_t n = static_cast<size_t>(pixels);

    const size_t low = static_cast<size_t>(static_cast<double>(n - 1) * 0.005 + 0.5);
    const size_t high = static_cast<size_t>(static_cast<double>(n - 1) * 0.995 + 0.5);
    stats.lightnessLow = s[low];
    stats.lightnessHigh = s[high];

    // The difference is taken in float and only then widened: a flat image
    // gives 0/0 here, which the clamp turns into 0 (std::max keeps its first
    // argument when the comparison with NaN fails).
    const float pointLow = stats.lightnessLow;
    const double spread = static_cast<double>(stats.lightnessHigh - pointLow);
    for (size_t i = 0; i < n; ++i) {
        const double q = static_cast<double>(s[i] - pointLow) / spread;
        s[i] = static_cast<float>(std::min(1.0, std::max(0.0, q)));
    }

    const int zeros = pixels - cv::countNonZero(sorted);
    const int notOnes = cv::countNonZero(1.0 - sorted);
    // One less than the number of values strictly inside (0, 1).
    const double interior = static_cast<double>(notOnes - zeros - 1);

    for (int i = 0; i < 32; ++i) {
        int64_t index = static_cast<int64_t>(zeros) + static_cast<int>(std::ceil(i / 31.0 * interior));
        // When every value is 0 (a flat image, or one pixel) Z = N and M = -1,
        // so i = 0 would read s[N]. Out-of-range indices are clamped into the
        // array: such an image then samples its (all-equal) end values.
        index = std::min<int64_t>(std::max<int64_t>(index, 0), static_cast<int64_t>(n) - 1);
        stats.lightness[i] = s[index];
    }
    return 0;
}

void MatrixSqrt(const cv::Mat& input, cv::Mat& output) {
    const cv::SVD svd(input, 0);
    cv::Mat rootW;
    cv::sqrt(svd.w, rootW);
    const cv::Mat root = svd.u * cv::Mat::diag(rootW) * svd.vt;
    root.copyTo(output);
}

}  // namespace vora
