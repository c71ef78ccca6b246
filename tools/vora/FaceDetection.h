#pragma once

// Faces for the library's face correction, in normalised coordinates (0..1
// across the width and the height, y downward).

#include <string>
#include <vector>

#include <opencv2/core.hpp>

#include "vora/TransferJson.h"

namespace vora {
namespace cli {

enum class FaceDetector {
    Hog,   // dlib's HOG frontal-face detector (its model is compiled into the tool)
    Haar,  // OpenCV's Haar cascade "frontalface_alt2" from opencv-data
};

struct DetectedFace {
    CFaceRect box{0, 0, 0, 0};
    double score = 0.0;  // detector's own confidence (HOG: SVM margin; Haar: neighbour count)
};

// The detector --faces auto uses: HOG when the tool was built with dlib.
FaceDetector DefaultFaceDetector();
bool FaceDetectorAvailable(FaceDetector detector);
std::string FaceDetectorName(FaceDetector detector);
FaceDetector ParseFaceDetector(const std::string& name);  // usage error if unknown or unavailable

// Finds frontal faces in a continuous CV_8UC3 R, G, B image. Throws Failure
// when the detector's data cannot be loaded.
std::vector<DetectedFace> DetectFaces(const cv::Mat& rgb, FaceDetector detector);

// "--faces" values: "auto", "none", or one or more "L,R,T,B" (normalised,
// 0 <= L < R <= 1, 0 <= T < B <= 1). No value means auto.
struct FaceRequest {
    enum Kind { Auto, None, Given } kind = Auto;
    std::vector<CFaceRect> boxes;  // for Given
};
FaceRequest ParseFaceRequest(const std::vector<std::string>& values);

// "L,R,T,B" with six digits, the form --faces reads.
std::string FormatFaceRect(const CFaceRect& box);

}  // namespace cli
}  // namespace vora
