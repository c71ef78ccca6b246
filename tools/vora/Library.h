#pragma once

// The tool's side of the library boundary: library statuses in plain words and
// image objects with an owner. Everything here goes through
// include/vora/vora.h only.

#include <memory>
#include <string>

#include <opencv2/core.hpp>

#include <vora/vora.h>

namespace vora {
namespace cli {

std::string StatusText(Status status);
// Failure("<subject>: <status in words>") unless status is STATUS_OK.
void CheckStatus(Status status, const std::string& subject);

// An image object owned by the tool: destroyed with the handle.
struct ImageObjectDeleter {
    void operator()(IImage* image) const {
        if (image) DestroyImageObj(image);
    }
};
using ImageHandle = std::unique_ptr<IImage, ImageObjectDeleter>;

// A whole image over the pixels of a continuous 8-bit matrix (3 or 4 channels).
ImageHandle WrapWholeImage(cv::Mat& pixels);

}  // namespace cli
}  // namespace vora
