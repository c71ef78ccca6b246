#include "vora/FaceDetection.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <sstream>

#include <opencv2/imgproc.hpp>
#include <opencv2/objdetect.hpp>

#ifdef VORA_HAVE_DLIB
#include <dlib/image_processing/frontal_face_detector.h>
#include <dlib/image_transforms.h>
#include <dlib/matrix.h>
#endif

#include "vora/Cli.h"

#ifndef VORA_HAAR_CASCADE
#define VORA_HAAR_CASCADE "/usr/share/opencv4/haarcascades/haarcascade_frontalface_alt2.xml"
#endif

namespace vora {
namespace cli {
namespace {

// Detection works on a copy whose long side is at most this: beyond it faces
// are large enough to be found at a lower resolution, and time grows with area.
constexpr int kMaxDetectionSide = 2000;

// Pixel rectangle in the detection image -> normalised box, clipped to the
// picture (detectors may report faces that reach over the border).
bool ToBox(double left, double top, double right, double bottom, double width, double height, CFaceRect& box) {
    box.left = std::clamp(left / width, 0.0, 1.0);
    box.right = std::clamp(right / width, 0.0, 1.0);
    box.top = std::clamp(top / height, 0.0, 1.0);
    box.bottom = std::clamp(bottom / height, 0.0, 1.0);
    return box.left < box.right && box.top < box.bottom;
}

cv::Mat Downscaled(const cv::Mat& rgb) {
    const int longSide = std::max(rgb.cols, rgb.rows);
    if (longSide <= kMaxDetectionSide) return rgb;
    const double f = static_cast<double>(kMaxDetectionSide) / longSide;
    cv::Mat small;
    cv::resize(rgb, small, cv::Size(), f, f, cv::INTER_AREA);
    return small;
}

#ifdef VORA_HAVE_DLIB
// HOG: one 2x upsampling below about 1000 pixels finds faces down to about
// 40 pixels; a threshold of 0.3 over the detector's own drops its weakest hits.
constexpr int kUpsampleBelow = 1000;
#ifndef VORA_HOG_THRESHOLD
#define VORA_HOG_THRESHOLD 0.3
#endif
constexpr double kHogThreshold = VORA_HOG_THRESHOLD;

std::vector<DetectedFace> DetectHog(const cv::Mat& rgbFull) {
    const cv::Mat rgb = Downscaled(rgbFull);
    dlib::matrix<dlib::rgb_pixel> image(rgb.rows, rgb.cols);
    for (int y = 0; y < rgb.rows; ++y) {
        const uchar* row = rgb.ptr<uchar>(y);
        for (int x = 0; x < rgb.cols; ++x) image(y, x) = dlib::rgb_pixel(row[3 * x], row[3 * x + 1], row[3 * x + 2]);
    }
    // Boxes are normalised by the size of the image searched, so the
    // upsampling needs no undoing.
    if (std::max(rgb.cols, rgb.rows) < kUpsampleBelow) dlib::pyramid_up(image);
    static dlib::frontal_face_detector detector = dlib::get_frontal_face_detector();
    std::vector<dlib::rect_detection> detections;
    detector(image, detections, kHogThreshold);
    std::vector<DetectedFace> faces;
    const double width = static_cast<double>(image.nc()), height = static_cast<double>(image.nr());
    for (const dlib::rect_detection& d : detections) {
        DetectedFace face;
        face.score = d.detection_confidence;
        // dlib's rectangles are inclusive pixel ranges.
        if (ToBox(d.rect.left(), d.rect.top(), d.rect.right() + 1.0, d.rect.bottom() + 1.0, width, height, face.box))
            faces.push_back(face);
    }
    return faces;
}
#endif

std::vector<DetectedFace> DetectHaar(const cv::Mat& rgbFull) {
    static cv::CascadeClassifier cascade;
    static bool loaded = false;
    const char* path = std::getenv("VORA_HAAR_CASCADE");
    if (!path || !*path) path = VORA_HAAR_CASCADE;
    if (!loaded) {
        try {
            loaded = cascade.load(path);
        } catch (const cv::Exception&) {
            loaded = false;
        }
        if (!loaded) throw Failure(path, "cannot load the face cascade (install opencv-data)");
    }
    const cv::Mat rgb = Downscaled(rgbFull);
    cv::Mat grey;
    cv::cvtColor(rgb, grey, cv::COLOR_RGB2GRAY);
    cv::equalizeHist(grey, grey);
    const int minSide = std::max(24, std::min(grey.cols, grey.rows) / 20);
    std::vector<cv::Rect> rects;
    std::vector<int> neighbours;
    cascade.detectMultiScale(grey, rects, neighbours, 1.1, 3, 0, cv::Size(minSide, minSide));
    std::vector<DetectedFace> faces;
    for (size_t i = 0; i < rects.size(); ++i) {
        const cv::Rect& r = rects[i];
        DetectedFace face;
        face.score = i < neighbours.size() ? neighbours[i] : 0;
        if (ToBox(r.x, r.y, r.x + r.width, r.y + r.height, grey.cols, grey.rows, face.box)) faces.push_back(face);
    }
    return faces;
}

bool ParseBox(const std::string& text, CFaceRect& box) {
    double v[4];
    char tail = 0;
    if (std::sscanf(text.c_str(), "%lf,%lf,%lf,%lf%c", &v[0], &v[1], &v[2], &v[3], &tail) != 4) return false;
    box = {v[0], v[1], v[2], v[3]};
    return true;
}

}  // namespace

FaceDetector DefaultFaceDetector() {
#ifdef VORA_HAVE_DLIB
    return FaceDetector::Hog;
#else
    return FaceDetector::Haar;
#endif
}

bool FaceDetectorAvailable(FaceDetector detector) {
#ifdef VORA_HAVE_DLIB
    (void)detector;
    return true;
#else
    return detector == FaceDetector::Haar;
#endif
}

std::string FaceDetectorName(FaceDetector detector) { return detector == FaceDetector::Hog ? "hog" : "haar"; }

FaceDetector ParseFaceDetector(const std::string& name) {
    FaceDetector detector;
    if (name == "hog")
        detector = FaceDetector::Hog;
    else if (name == "haar")
        detector = FaceDetector::Haar;
    else
        throw UsageError("--detector: '" + name + "' is not a detector (hog or haar)");
    if (!FaceDetectorAvailable(detector)) throw UsageError("--detector: this vora was built without dlib; use haar");
    return detector;
}

std::vector<DetectedFace> DetectFaces(const cv::Mat& rgb, FaceDetector detector) {
    CV_Assert(rgb.type() == CV_8UC3);
#ifdef VORA_HAVE_DLIB
    if (detector == FaceDetector::Hog) return DetectHog(rgb);
#endif
    (void)detector;
    return DetectHaar(rgb);
}

FaceRequest ParseFaceRequest(const std::vector<std::string>& values) {
    FaceRequest request;
    if (values.empty()) return request;
    if (values.size() == 1 && (values[0] == "auto" || values[0] == "none")) {
        request.kind = values[0] == "auto" ? FaceRequest::Auto : FaceRequest::None;
        return request;
    }
    request.kind = FaceRequest::Given;
    for (const std::string& value : values) {
        if (value == "auto" || value == "none")
            throw UsageError("--faces: '" + value + "' cannot be combined with other --faces values");
        CFaceRect box(0, 0, 0, 0);
        if (!ParseBox(value, box))
            throw UsageError("--faces: '" + value + "' is not auto, none or L,R,T,B (four numbers)");
        const bool inside = box.left >= 0.0 && box.left < box.right && box.right <= 1.0 && box.top >= 0.0 &&
                            box.top < box.bottom && box.bottom <= 1.0;
        if (!inside)
            throw UsageError("--faces: '" + value + "' is not a face box (needs 0 <= L < R <= 1 and 0 <= T < B <= 1)");
        request.boxes.push_back(box);
    }
    return request;
}

std::string FormatFaceRect(const CFaceRect& box) {
    char text[128];
    std::snprintf(text, sizeof text, "%.6f,%.6f,%.6f,%.6f", box.left, box.right, box.top, box.bottom);
    return text;
}

}  // namespace cli
}  // namespace vora
