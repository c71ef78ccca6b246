#pragma once

#include <opencv2/core.hpp>

#include <vora/vora.h>

namespace vora {

// Measures each host face after the transfer and appends a correction for
// those whose median lightness falls below finishFactor x 0.5. Returns 0.
// A face whose sample reaches outside the image throws OpenCV's exception.
// A null face array is read as no faces whatever the count, and a sample
// with one side of 0 pixels (nothing to take a median of) is skipped.
int FinishTransfer(const cv::Mat& lab, const VoraParameters& params, TRANSFER& transfer);

// The per-pixel transfer without the face lift, in matrix form. sample is
// CV_32FC3 working Lab (may be a view); result receives a new matrix.
void ApplyTransferToLab(const cv::Mat& sample, const TRANSFER& transfer, cv::Mat& result);

}  // namespace vora
