#include "vora/Library.h"

#include <new>
#include <string>

#include "vora/Cli.h"

namespace vora {
namespace cli {

std::string StatusText(Status status) {
    switch (status) {
    case STATUS_OK:
        return "done";
    case STATUS_INVALID_ARGUMENT:
        return "the library refused the image (no pixels, or mismatched source and destination)";
    case STATUS_NO_TRANSFERS_REQUESTED:
        return "no transfers were requested";
    case STATUS_MODEL_INCOMPLETE:
        return "the model is incomplete: a data file is missing or the files disagree (see 'vora inspect')";
    case STATUS_NO_USABLE_STYLE:
        return "the model offers no usable style for this photo's scene (see 'vora inspect')";
    case STATUS_STYLE_INDEX_OUT_OF_RANGE:
        return "the style index is outside the model's style database";
    case STATUS_NON_FINITE_RESULT:
        return "the transfer came out with values that are not finite numbers: the model's style records "
               "hold NaN or infinity (see 'vora inspect')";
    }
    return "the library returned the unknown status " + std::to_string(static_cast<int>(status));
}

void CheckStatus(Status status, const std::string& subject) {
    if (status != STATUS_OK) throw Failure(subject, StatusText(status));
}

ImageHandle WrapWholeImage(cv::Mat& pixels) {
    CV_Assert(pixels.depth() == CV_8U && pixels.isContinuous());
    const size_t layout[4] = {0, 0, 0, 0};
    const size_t width = static_cast<size_t>(pixels.cols), height = static_cast<size_t>(pixels.rows);
    ImageHandle image(CreateImageObj(height, width, static_cast<size_t>(pixels.channels()), layout, pixels.data,
                                     CFullResImageSize(width, height), CTopLeftCoordinate(0, 0)));
    if (!image) throw std::bad_alloc();
    return image;
}

}  // namespace cli
}  // namespace vora
