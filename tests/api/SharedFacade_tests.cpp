// Four threads sharing one facade as the header allows: both compute_transfer
// forms and apply_transfer at any time, compute_transfers on one thread only,
// so that no two of them overlap. Every result must equal a serial run's.
//
// Built with ThreadSanitizer (VORA_THREAD_SANITIZER), the test limits TBB and
// OpenCV to the calling thread: their own worker threads are not
// instrumented, so what they do would be invisible or reported falsely. The
// four threads of the test are then the only ones, all instrumented.
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cstring>
#include <functional>
#include <thread>
#include <vector>

#include <opencv2/core.hpp>
#include <tbb/global_control.h>

#include <vora/vora.h>

#include "support/ModelFixtures.h"
#include "support/TestImages.h"

namespace vora {
namespace {

using testimages::ImageHandle;
using testimages::SameRecord;

TEST(SharedFacade, FourThreadsGiveTheSerialResults) {
#ifdef VORA_THREAD_SANITIZER
    tbb::global_control oneThread(tbb::global_control::max_allowed_parallelism, 1);
    cv::setNumThreads(0);
#endif
    const fixtures::ModelFixture model(fixtures::RandomDatabase(4, 16));
    const vora_api api(model.modelDir());
    cv::Mat photo = testimages::SyntheticPhotoRgb(192, 256, 3);  // large enough for the colour cache
    cv::Mat look = testimages::SyntheticPhotoRgb(64, 80, 11);
    const ImageHandle content(photo), style(look);
    VoraParameters params;
    const CFaceRect face(0.3, 0.6, 0.2, 0.7);  // left, right, top, bottom
    params.faceRects = &face;
    params.numFaceRects = 1;
    params.numTransfers = 3;
    params.finishFactor = 2.0f;  // a target lightness of 1: the face is always corrected

    // Each operation once, serially; apply renders the first serial proposal,
    // so that its input does not depend on the other threads.
    std::vector<TRANSFER> proposals(3);
    TRANSFER towardImage, towardStyle;
    ASSERT_EQ(api.compute_transfers(content.get(), proposals, params), STATUS_OK);
    ASSERT_EQ(api.compute_transfer(content.get(), style.get(), towardImage, params), STATUS_OK);
    ASSERT_EQ(api.compute_transfer(content.get(), 5, towardStyle, params), STATUS_OK);
    ASSERT_FALSE(proposals[0].faceCorrections.empty());  // apply's face path is exercised
    const auto render = [&](cv::Mat target) {
        const ImageHandle out(target);
        return api.apply_transfer(content.get(), proposals[0], out.get()) == STATUS_OK ? target : cv::Mat();
    };
    const cv::Mat applied = render(cv::Mat(photo.size(), photo.type(), cv::Scalar::all(0)));

    // Whether one more run of each operation gives the serial result; only
    // the first thread runs compute_transfers.
    const std::function<bool()> operations[] = {
        [&] {
            std::vector<TRANSFER> again(3);
            return api.compute_transfers(content.get(), again, params) == STATUS_OK &&
                   std::equal(again.begin(), again.end(), proposals.begin(), SameRecord);
        },
        [&] {
            TRANSFER t;
            return api.compute_transfer(content.get(), style.get(), t, params) == STATUS_OK &&
                   SameRecord(t, towardImage);
        },
        [&] {
            TRANSFER t;
            return api.compute_transfer(content.get(), 5, t, params) == STATUS_OK && SameRecord(t, towardStyle);
        },
        [&] {  // into its own image, reading the shared content
            const cv::Mat target = render(cv::Mat(photo.size(), photo.type(), cv::Scalar::all(0)));
            return !target.empty() && std::memcmp(target.data, applied.data, target.total() * 3) == 0;
        }};
    std::atomic<int> mismatches{0};
    std::vector<std::thread> threads;
    for (const auto& operation : operations)
        threads.emplace_back([&mismatches, operation] {
            for (int round = 0; round < 3; ++round) mismatches += operation() ? 0 : 1;
        });
    for (std::thread& t : threads) t.join();
    EXPECT_EQ(mismatches.load(), 0);
}

}  // namespace
}  // namespace vora
