// suggest writes the library's own records and renderings, full size and as
// previews; apply renders those records on every kind of photo.

#include <set>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>
#include <opencv2/imgproc.hpp>

#include "tools/vora/CliSupport.h"
#include "vora/TransferJson.h"

namespace {

using namespace vora::clitest;

TEST_F(CliTest, SuggestAndApplyGiveTheLibrarysBytesAndRecords) {
    const RunResult r = Run({"suggest", "photo.png", "--model", m_modelDir, "-n", "3", "--faces", kFace, "--out",
                             "s", "--ranking", "0.5", "--finish", "1.5"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(ListTree(m_work + "/s"), (std::set<std::string>{"photo-0.png", "photo-1.png", "photo-2.png",
                                                              "contact-sheet.png", "transfers.json"}));
    EXPECT_GT(ReadRgb(m_work + "/s/contact-sheet.png").cols, 2 * 160);

    const vora::CFaceRect face(0.3, 0.5, 0.25, 0.55);
    vora::VoraParameters params;
    params.numTransfers = 3;
    params.rankingFactor = 0.5f;
    params.finishFactor = 1.5f;
    params.faceRects = &face;
    params.numFaceRects = 1;
    std::vector<vora::TRANSFER> expected(3);
    ASSERT_EQ(m_api.compute_transfers(ImageHandle(m_photo).get(), expected, params), vora::STATUS_OK);

    // Previews: the same records, rendered on the photo scaled by area
    // averaging to the long side asked for (160 x 120 -> 100 x 75).
    const RunResult p = Run({"suggest", "photo.png", "--model", m_modelDir, "-n", "3", "--faces", kFace, "--out",
                             "p", "--ranking", "0.5", "--finish", "1.5", "--preview", "100"});
    ASSERT_EQ(p.status, 0) << p.err;
    EXPECT_NE(p.out.find("previews: 100 x 75"), std::string::npos) << p.out;
    cv::Mat preview;
    cv::resize(m_photo, preview, cv::Size(100, 75), 0, 0, cv::INTER_AREA);

    const vora::cli::TransferDocument saved = vora::cli::ReadTransfersFile(m_work + "/s/transfers.json");
    const vora::cli::TransferDocument previewed = vora::cli::ReadTransfersFile(m_work + "/p/transfers.json");
    ASSERT_TRUE(saved.transfers.size() == 3u && previewed.transfers.size() == 3u);
    EXPECT_TRUE(saved.faces.size() == 1 && saved.faces[0].left == 0.3 && saved.faceSource == "given");
    EXPECT_TRUE(saved.rankingFactor == 0.5f && saved.finishFactor == 1.5f && saved.photoWidth == 160u);
    EXPECT_EQ(previewed.photoWidth, 160u);
    size_t lifted = 3;  // a record that lifts the dark face
    for (size_t k = 0; k < 3; ++k) {
        SCOPED_TRACE(k);
        const std::string file = "/photo-" + std::to_string(k) + ".png";
        EXPECT_TRUE(SameRecord(saved.transfers[k], expected[k]) && SameRecord(previewed.transfers[k], expected[k]));
        EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/s" + file), ApplyDirect(m_api, m_photo, expected[k])));
        EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/p" + file), ApplyDirect(m_api, preview, expected[k])));
        if (!expected[k].faceCorrections.empty()) lifted = k;
    }
    ASSERT_LT(lifted, 3u) << "the dark face should be lifted by at least one proposal";

    // apply, on every kind of photo; the face lift on the big one, which the
    // bands must place right. The model comes from the file.
    cv::Mat rgba, alpha(m_photo.size(), CV_8U), grey, greyRgb, deep;
    cv::randu(alpha, 0, 256);
    cv::merge(std::vector<cv::Mat>{m_photo, alpha}, rgba);
    cv::cvtColor(m_photo, grey, cv::COLOR_RGB2GRAY);
    cv::cvtColor(grey, greyRgb, cv::COLOR_GRAY2RGB);
    m_photo.convertTo(deep, CV_16U, 257.0);  // every 16-bit value an exact multiple of 257
    const cv::Mat big = SyntheticPhotoRgb(900, 2300);  // bands of 455 rows, the last one short
    using Apply = std::tuple<std::string, cv::Mat, cv::Mat, size_t>;  // file, as written, library input, record
    for (const auto& [name, written, pixels, k] : std::vector<Apply>{{"photo.png", m_photo, m_photo, 0},
             {"big.png", big, big, lifted}, {"rgba.png", rgba, rgba, 1}, {"grey.png", grey, greyRgb, 2},
             {"deep.png", deep, m_photo, lifted}}) {
        WriteRgb(m_work + "/" + name, written);
        // A plain file name means record 0.
        const RunResult a = Run({"apply", name, "s/transfers.json" + (k ? ":" + std::to_string(k) : ""), "o" + name});
        ASSERT_EQ(a.status, 0) << a.err;
        EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/o" + name), ApplyDirect(m_api, pixels, expected[k]))) << name;
        EXPECT_EQ(a.err.find("16-bit samples reduced to 8 bits") != std::string::npos, name == "deep.png") << a.err;
    }
}

}  // namespace
