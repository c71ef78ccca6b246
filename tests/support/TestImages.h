#pragma once
// Synthetic photographs and image-object helpers shared by the test programs.

#include <cstdint>
#include <memory>
#include <random>
#include <vector>

#include <opencv2/core.hpp>

#include <vora/vora.h>

namespace vora {
namespace testimages {

// A smooth, photo-like R, G, B image (gradients, a few soft blobs, mild
// noise) with a darker oval where a face would be; deterministic per seed.
cv::Mat SyntheticPhotoRgb(int rows, int cols, uint32_t seed = 7);

// A whole image object over an R, G, B matrix's pixels (which must be continuous).
struct ImageHandle {
    explicit ImageHandle(cv::Mat& rgb);
    ~ImageHandle();
    ImageHandle(const ImageHandle&) = delete;
    ImageHandle& operator=(const ImageHandle&) = delete;
    IImage* get() const { return image; }
    IImage* image;
};

// An owned image object: a tile `r` of `m`, its rows a full image width
// apart, placed at r's corner of the full image.
struct ImageDeleter {
    void operator()(IImage* image) const { DestroyImageObj(image); }
};
using ImagePtr = std::unique_ptr<IImage, ImageDeleter>;
ImagePtr Tile(cv::Mat& m, cv::Rect r);

// True when every field of the two records, the face list included, is bit-identical.
bool SameRecord(const TRANSFER& a, const TRANSFER& b);

// Tiles covering a 1500 x 1000 image (SyntheticPhotoRgb(1000, 1500)), in
// shuffled order: cuts at x = 675 and 799 and y = 349 and 410, which cross
// the face boxes of the colour tests, and `extraCuts` random cuts each way.
std::vector<cv::Rect> RandomTiling1500x1000(std::mt19937& random, int extraCuts);

}  // namespace testimages
}  // namespace vora
