#include "transfer/FinishTransfer.h"

#include <algorithm>
#include <cmath>
#include <cstdint>

#include "color/PixelTransfer.h"

namespace vora {

namespace {

// Truncation toward zero of a sample bound in pixels. Bounds saturate at
// +-2^29 (and NaN becomes 0) so that the conversion and the width arithmetic
// cannot overflow; a bound that far out lies outside any image, and the
// sub-matrix then throws as for any rectangle outside the image.
int TruncateBound(double pixels) {
    constexpr double kLimit = 536870912.0;  // 2^29
    if (!(pixels == pixels)) return 0;
    return static_cast<int>(std::min(kLimit, std::max(-kLimit, pixels)));
}

}  // namespace

void ApplyTransferToLab(const cv::Mat& sample, const TRANSFER& transfer, cv::Mat& result) {
    result = sample.clone();
    const int pixels = result.rows * result.cols;
    cv::Mat columns = result.reshape(1, pixels);

    // Lightness: OpenCV's matrix arithmetic (its rounding differs from apply's
    // per-pixel division in the last bit), and no guard for a zero spread:
    // that gives NaN, which OpenCV's vectorised max turns into 0 while its
    // scalar tail keeps it, and the lookup sends a NaN to toneCurve[255].
    cv::Mat lightness = columns.col(0);
    const double spread = static_cast<double>(transfer.lightnessHigh - transfer.lightnessLow);
    cv::Mat t = (lightness - transfer.lightnessLow) / spread;
    t = cv::max(t, 0.0);
    t = cv::min(t, 1.0);
    for (int i = 0; i < pixels; ++i) {
        columns.at<float>(i, 0) = ToneCurveLookup(transfer.toneCurve, t.at<float>(i, 0));
    }

    // Chroma: rows (a, b) times the matrix from the right. That is the
    // transpose of apply's convention; the two agree for the symmetric maps
    // the solve produces.
    cv::Mat chroma = columns.colRange(1, 3);
    const cv::Mat centred = chroma.reshape(2) - cv::Scalar(transfer.contentMean[0], transfer.contentMean[1]);
    const cv::Mat map = cv::Mat(2, 2, CV_32F, const_cast<float*>(transfer.chromaMatrix)).clone();
    const cv::Mat mapped = centred.reshape(1, pixels) * map;
    const cv::Mat shifted = mapped.reshape(2) + cv::Scalar(transfer.styleMean[0], transfer.styleMean[1]);
    shifted.reshape(1, pixels).copyTo(chroma);
}

int FinishTransfer(const cv::Mat& lab, const VoraParameters& params, TRANSFER& transfer) {
    return FinishTransfer(lab.size(), [&lab](const cv::Rect& region) { return lab(region); }, params, transfer);
}

int FinishTransfer(cv::Size size, const std::function<cv::Mat(const cv::Rect&)>& labOf,
                   const VoraParameters& params, TRANSFER& transfer) {
    const float target = params.finishFactor * 0.5f;
    const int32_t count = static_cast<int32_t>(params.numFaceRects);
    // A null array with a non-zero count is read as no faces, never dereferenced.
    const CFaceRect* faces = params.faceRects;
    if (count < 1 || faces == nullptr) {
        transfer.faceCorrections.resize(0);
        return 0;
    }
    transfer.faceCorrections.resize(static_cast<size_t>(count));

    size_t written = 0;
    for (int32_t i = 0; i < count; ++i) {
        const CFaceRect& face = faces[i];
        const double centreX = (face.left + face.right) * 0.5;
        const double centreY = (face.top + face.bottom) * 0.5 + (face.bottom - face.top) * 0.125;
        const double halfX = (face.right - face.left) * 0.28;
        const double halfY = (face.bottom - face.top) * 0.28;

        const int x1 = TruncateBound((centreX + halfX) * size.width);
        const int x2 = TruncateBound((centreX - halfX) * size.width);
        const int y1 = TruncateBound((centreY + halfY) * size.height);
        const int y2 = TruncateBound((centreY - halfY) * size.height);
        const int width = std::max(x1, x2) - std::min(x1, x2);
        const int height = std::max(y1, y2) - std::min(y1, y2);
        // Sampled when either side reaches 10 pixels. An empty sample (one
        // side 0) has no median and is skipped as well.
        if (width < 10 && height < 10) continue;
        if (width == 0 || height == 0) continue;

        // No clipping: a rectangle outside the image throws OpenCV's exception.
        const cv::Mat sample = labOf(cv::Rect(std::min(x1, x2), std::min(y1, y2), width, height));
        cv::Mat transferred;
        ApplyTransferToLab(sample, transfer, transferred);

        const int pixels = width * height;
        cv::Mat sorted;
        cv::sort(transferred.reshape(1, pixels), sorted, cv::SORT_EVERY_COLUMN | cv::SORT_ASCENDING);
        // Row N/2: for even N the upper of the two middle values.
        const float* median = sorted.ptr<float>(pixels / 2);
        const float measuredL = median[0];
        if (!(target > measuredL)) continue;

        FaceCorrection& entry = transfer.faceCorrections[written++];
        entry.centreX = static_cast<float>(centreX);
        entry.centreY = static_cast<float>(centreY);
        entry.halfSizeX = static_cast<float>(halfX);
        entry.halfSizeY = static_cast<float>(halfY);
        entry.measuredL = measuredL;
        entry.measuredA = median[1];
        entry.measuredB = median[2];
        entry.exponent = std::max(0.5f, measuredL / target);
    }
    transfer.faceCorrections.resize(written);
    return 0;
}

namespace {

bool AllFinite(const float* values, size_t count) {
    for (size_t i = 0; i < count; ++i)
        if (!std::isfinite(values[i])) return false;
    return true;
}

}  // namespace

bool TransferIsFinite(const TRANSFER& t) {
    bool finite = AllFinite(t.contentMean, 2) && AllFinite(t.styleMean, 2) && AllFinite(t.chromaMatrix, 4) &&
                  AllFinite(t.toneCurve, 257) && std::isfinite(t.lightnessLow) && std::isfinite(t.lightnessHigh);
    for (const FaceCorrection& f : t.faceCorrections) {
        const float values[8] = {f.centreX, f.centreY, f.halfSizeX, f.halfSizeY,
                                 f.measuredL, f.measuredA, f.measuredB, f.exponent};
        finite = finite && AllFinite(values, 8);
    }
    return finite;
}

}  // namespace vora
