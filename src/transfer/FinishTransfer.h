#pragma once

#include <functional>

#include <opencv2/core.hpp>

#include <vora/vora.h>

#include "KitApi.h"

namespace vora {

// Measures each host face after the transfer and appends a correction for
// those whose median lightness falls below finishFactor x 0.5. Returns 0.
// A face whose sample reaches outside the image throws OpenCV's exception.
// A null face array is read as no faces whatever the count, and a sample
// with one side of 0 pixels (nothing to take a median of) is skipped.
int FinishTransfer(const cv::Mat& lab, const VoraParameters& params, TRANSFER& transfer);

// The same over an image of `size` whose working Lab is produced only where a
// face is sampled: labOf(region) returns the CV_32FC3 Lab of that region, and
// throws as a sub-matrix does for a region outside the image.
int FinishTransfer(cv::Size size, const std::function<cv::Mat(const cv::Rect&)>& labOf,
                   const VoraParameters& params, TRANSFER& transfer);

// The per-pixel transfer without the face lift, in matrix form. sample is
// CV_32FC3 working Lab (may be a view); result receives a new matrix.
// Whether every number of a record is finite, face corrections included: a
// record with NaN or infinity would render garbage.
VORA_KIT_API bool TransferIsFinite(const TRANSFER& transfer);

void ApplyTransferToLab(const cv::Mat& sample, const TRANSFER& transfer, cv::Mat& result);

}  // namespace vora
