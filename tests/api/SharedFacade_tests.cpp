// Four threads sharing one facade as the header allows: both compute_transfer
// forms and apply_transfer at any time, compute_transfers on one thread only,
// so that no two of them overlap. Every result must equal a serial run's.
//
// Built with ThreadSanitizer (VORA_THREAD_SANITIZER), the test limits TBB and
// OpenCV to the calling thread: their own worker threads are not
// instrumented, so what they do would be invisible or reported falsely. The
// four threads of the test are then the only ones, all instrumented.
#include <gtest/gtest.h>

#include <atomic>
#include <cstring>
#include <memory>
#include <thread>
#include <vector>

#include <opencv2/core.hpp>
#include <tbb/global_control.h>

#include <vora/vora.h>

#include "support/ModelFixtures.h"
#include "support/TestImages.h"

#if defined(__SANITIZE_THREAD__)
#define VORA_UNDER_TSAN 1
#elif defined(__has_feature)
#if __has_feature(thread_sanitizer)
#define VORA_UNDER_TSAN 1
#endif
#endif

namespace vora {
namespace {

using testimages::ImageHandle;
using testimages::SameRecord;

struct Results {
    std::vector<TRANSFER> proposals;
    TRANSFER towardImage;
    TRANSFER towardStyle;
    cv::Mat applied;
};

TEST(SharedFacade, FourThreadsGiveTheSerialResults) {
#ifdef VORA_UNDER_TSAN
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

    // One pass of every operation; `apply` uses the first proposal of a serial
    // run, so that its input does not depend on the other threads.
    auto computeAll = [&](Results& r) {
        r.proposals.assign(3, TRANSFER{});
        ASSERT_EQ(api.compute_transfers(content.get(), r.proposals, params), STATUS_OK);
    };
    Results serial;
    computeAll(serial);
    ASSERT_EQ(api.compute_transfer(content.get(), style.get(), serial.towardImage, params), STATUS_OK);
    ASSERT_EQ(api.compute_transfer(content.get(), 5, serial.towardStyle, params), STATUS_OK);
    ASSERT_FALSE(serial.proposals[0].faceCorrections.empty());  // apply's face path is exercised
    serial.applied = photo.clone();
    {
        const ImageHandle out(serial.applied);
        ASSERT_EQ(api.apply_transfer(content.get(), serial.proposals[0], out.get()), STATUS_OK);
    }

    constexpr int kRounds = 3;
    std::atomic<int> mismatches{0};
    std::vector<std::thread> threads;
    threads.emplace_back([&] {  // the only thread that runs compute_transfers
        for (int i = 0; i < kRounds; ++i) {
            Results r;
            computeAll(r);
            for (size_t k = 0; k < r.proposals.size(); ++k)
                if (!SameRecord(r.proposals[k], serial.proposals[k])) ++mismatches;
        }
    });
    threads.emplace_back([&] {
        for (int i = 0; i < kRounds; ++i) {
            TRANSFER t;
            if (api.compute_transfer(content.get(), style.get(), t, params) != STATUS_OK ||
                !SameRecord(t, serial.towardImage))
                ++mismatches;
        }
    });
    threads.emplace_back([&] {
        for (int i = 0; i < kRounds; ++i) {
            TRANSFER t;
            if (api.compute_transfer(content.get(), 5, t, params) != STATUS_OK || !SameRecord(t, serial.towardStyle))
                ++mismatches;
        }
    });
    threads.emplace_back([&] {  // apply into its own image, reading the shared content
        for (int i = 0; i < kRounds; ++i) {
            cv::Mat target(photo.size(), photo.type(), cv::Scalar::all(0));
            const ImageHandle out(target);
            if (api.apply_transfer(content.get(), serial.proposals[0], out.get()) != STATUS_OK ||
                std::memcmp(target.data, serial.applied.data, target.total() * target.elemSize()) != 0)
                ++mismatches;
        }
    });
    for (std::thread& t : threads) t.join();
    EXPECT_EQ(mismatches.load(), 0);
}

}  // namespace
}  // namespace vora
