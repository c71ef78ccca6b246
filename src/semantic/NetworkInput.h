#pragma once

#include <opencv2/core.hpp>

#include "KitApi.h"
#include "color/WorkingOrder.h"

namespace vora {

class FeatureNetwork;

constexpr int kNetworkInputSize = 256;
constexpr int kNetworkImageSize = 227;
constexpr double kMaxAspectRatio = 1.5;

// Aspect crop, then an area resize into a black input canvas (14 px border at
// top and left, 15 at bottom and right for 227 in 256). Returns false, after
// the diagnostic on standard error, when the image is empty.
VORA_KIT_API bool PrepareNetworkImage(const cv::Mat& image, cv::Mat& output, int cropSize, int inputSize);

// The region PrepareNetworkImage keeps of an image of the given size.
cv::Rect AspectCropRegion(int rows, int cols);

// Runs the network once and copies the first 512 output floats into feature.
// Returns false when the image is empty (the feature is left as it was).
// The network takes B, G, R; an R, G, B image is resized as it stands and
// only the small input is reordered (the resize treats channels alike).
bool ExtractFeature(FeatureNetwork& network, const cv::Mat& pixels8, float* feature,
                    ChannelOrder order = ChannelOrder::Bgr);

}  // namespace vora
