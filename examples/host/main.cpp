// A minimal vora host: load a model, propose transfers for a photo, render the
// first proposal tile by tile, write the result.
//
//   vora_host MODEL_DIR PHOTO OUTPUT [TILE_SIZE]
#include <vora/vora.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <vector>

#include <opencv2/core.hpp>
#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

int main(int argc, char** argv) {
    if (argc < 4) {
        std::fprintf(stderr, "usage: %s MODEL_DIR PHOTO OUTPUT [TILE_SIZE]\n", argv[0]);
        return 2;
    }
    const size_t tileSize = argc > 4 ? std::strtoul(argv[4], nullptr, 10) : 512;
    try {
        vora::vora_api api(argv[1]);

        // vora reads packed R, G, B bytes; OpenCV decodes to B, G, R.
        cv::Mat bgr = cv::imread(argv[2], cv::IMREAD_COLOR);
        if (bgr.empty()) {
            std::fprintf(stderr, "%s: cannot read image\n", argv[2]);
            return 1;
        }
        cv::Mat rgb;
        cv::cvtColor(bgr, rgb, cv::COLOR_BGR2RGB);
        const size_t width = rgb.cols, height = rgb.rows;
        const size_t layout[4] = {0, 0, 0, 0};
        const vora::CFullResImageSize fullSize(width, height);

        vora::IImage* photo = vora::CreateImageObj(height, width, 3, layout, rgb.data, fullSize, {0, 0});
        vora::VoraParameters params;
        params.numTransfers = 3;
        std::vector<vora::TRANSFER> proposals(params.numTransfers);
        const vora::Status status = api.compute_transfers(photo, proposals, params);
        vora::DestroyImageObj(photo);
        if (status != vora::STATUS_OK) {
            std::fprintf(stderr, "compute_transfers failed with status %d\n", static_cast<int>(status));
            return 1;
        }
        for (const vora::TRANSFER& t : proposals)
            std::printf("proposal: style %d from cluster %d\n", t.styleIndex, t.clusterIndex);

        // Render the first proposal in place, one tile at a time.
        const size_t tileStep = std::max<size_t>(tileSize, 1);
        for (size_t top = 0; top < height; top += tileStep) {
            for (size_t left = 0; left < width; left += tileStep) {
                const size_t w = std::min(tileStep, width - left), h = std::min(tileStep, height - top);
                uint8_t* first = rgb.data + (top * width + left) * 3;
                vora::IImage* tile =
                    vora::GetTileImageObj(h, w, 3, layout, first, fullSize, vora::CTopLeftCoordinate(left, top));
                api.apply_transfer(tile, proposals[0], tile);
                vora::ReturnTileImageObj(tile);
            }
        }

        cv::cvtColor(rgb, bgr, cv::COLOR_RGB2BGR);
        if (!cv::imwrite(argv[3], bgr)) {
            std::fprintf(stderr, "%s: cannot write image\n", argv[3]);
            return 1;
        }
        std::printf("wrote %s\n", argv[3]);
    } catch (const std::exception& e) {
        std::fprintf(stderr, "error: %s\n", e.what());
        return 1;
    }
    return 0;
}
