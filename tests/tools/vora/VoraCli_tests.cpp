// End-to-end tests of the vora command-line tool: the executable is run on
// fixture models and generated photos, and what it writes is compared with
// direct calls of libvora.

#include <vora/vora.h>

#include <sys/wait.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <random>
#include <set>
#include <sstream>
#include <string>
#include <tuple>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>
#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include "model/StyleDatabase.h"
#include "support/ModelFixtures.h"
#include "support/TestImages.h"
#include "tools/vora/CliSupport.h"
#include "vora/Cli.h"
#include "vora/OutputFiles.h"
#include "vora/TransferJson.h"

namespace {

namespace fs = std::filesystem;
using vora::fixtures::FixtureOptions;
using vora::fixtures::ModelFixture;
using vora::testimages::ImageHandle;
using vora::testimages::SameRecord;
using vora::testimages::SyntheticPhotoRgb;
using namespace vora::clitest;

// =============================================================================
// Running the tool
// =============================================================================

bool SameBytes(const cv::Mat& a, const cv::Mat& b) {
    return a.size() == b.size() && a.type() == b.type() && cv::norm(a, b, cv::NORM_INF) == 0.0;
}

// Library result for a whole image, the reference every rendering is held to.
cv::Mat ApplyDirect(const vora::vora_api& api, const cv::Mat& pixels, const vora::TRANSFER& t) {
    cv::Mat out = pixels.clone();
    ImageHandle image(out);
    EXPECT_EQ(api.apply_transfer(image.get(), t, image.get()), vora::STATUS_OK);
    return out;
}

// What --strength S documents: each colour byte o + S x (r - o), in double,
// rounded half up.
cv::Mat Mixed(const cv::Mat& original, const cv::Mat& restyled, double strength) {
    cv::Mat out = restyled.clone();
    for (size_t i = 0; i < out.total() * out.channels(); ++i) {
        const double o = original.data[i], r = restyled.data[i];
        out.data[i] = static_cast<uint8_t>(std::floor(o + strength * (r - o) + 0.5));
    }
    return out;
}

// The dark oval of SyntheticPhotoRgb, given as the face.
const char* const kFace = "0.3,0.5,0.25,0.55";

// =============================================================================
// Bad input: message, exit status, nothing written
// =============================================================================

TEST_F(CliTest, BadInputGetsItsMessageAndStatusAndWritesNothing) {
    const std::string& m = m_modelDir;
    ASSERT_EQ(Run({"match", "photo.png", "photo.png", "first.png", "--model", m, "--json", "t.json"}).status, 0);
    vora::fixtures::WriteBytes(m_work + "/garbage.jpg", "this is not a picture");
    vora::fixtures::WriteBytes(m_work + "/empty.png", "");
    vora::fixtures::WriteBytes(m_work + "/broken.json", "{\"format\": \"vora-transfers\", ");
    vora::fixtures::WriteBytes(m_work + "/future.json", "{\"format\": \"vora-transfers\", \"version\": 9}");
    // A 16384 x 16384 PNG of a few hundred kilobytes (decoding it took 7 GB),
    // and the first half of a JPEG (it rendered with streaks and exit 0).
    ASSERT_TRUE(cv::imwrite(m_work + "/huge.png", cv::Mat(16384, 16384, CV_8UC1, cv::Scalar(9))));
    std::vector<uchar> jpeg;
    ASSERT_TRUE(cv::imencode(".jpg", cv::Mat(64, 64, CV_8UC3, cv::Scalar(10, 200, 30)), jpeg));
    vora::fixtures::WriteBytes(m_work + "/half.jpg", std::string(jpeg.begin(), jpeg.begin() + jpeg.size() / 2));
    // A folder left by an earlier run of five proposals, its contact sheet deleted.
    std::filesystem::create_directory(m_work + "/old");
    vora::fixtures::WriteBytes(m_work + "/old/photo-4.jpg", "an earlier proposal");
    using Case = std::tuple<std::vector<std::string>, int, std::string>;  // arguments, status, mentions
    const std::vector<Case> cases = {
        // Usage errors exit 2.
        {{}, 2, "no command given"},
        {{"resize"}, 2, "unknown command 'resize'"},
        {{"suggest", "photo.png", "--model", m, "--colour", "red"}, 2, "unknown option --colour"},
        {{"suggest", "photo.png", "--model", m, "-n", "0"}, 2, "-n"},
        {{"suggest", "photo.png", "--model", m, "-n", "five"}, 2, "-n"},
        // 12 styles: the library keeps the better 6 per cluster.
        {{"suggest", "photo.png", "--model", m, "-n", "7"}, 2, "6 styles"},
        {{"suggest", "photo.png", "--model", m, "--ranking", "nan"}, 2, "--ranking"},
        {{"suggest", "photo.png", "--model", m, "--preview", "8"}, 2, "--preview"},
        {{"suggest", "photo.png", "--model", m, "--full", "--preview", "100"}, 2, "choose one"},
        {{"suggest", "photo.png", "--model", m, "--solve", "0"}, 2, "--solve"},
        {{"suggest", "photo.png", "--model", m, "--limit", "inf"}, 2, "--limit"},
        {{"suggest", "photo.png", "--model", m, "--finish", "3"}, 2, "--finish"},
        {{"suggest", "photo.png", "--model", m, "-n", "2", "--out", "old"}, 2, "old/photo-4.jpg: a proposal of an earlier run"},
        {{"suggest", "photo.png", "--model", m, "--faces", "0.6,0.4,0.1,0.5"}, 2, "0.6,0.4,0.1,0.5"},
        {{"suggest", "photo.png", "--model", m, "--faces", "0.1,0.4,0.5,1.5"}, 2, "--faces"},
        {{"suggest", "photo.png", "--model", m, "--faces", "0.1,0.4"}, 2, "--faces"},
        {{"suggest", "photo.png", "--model", m, "--faces", "auto", "--faces", "0.1,0.4,0.1,0.4"}, 2, "auto"},
        {{"match", "photo.png", "--style-index", "12", "out.png", "--model", m}, 2, "--style-index"},
        {{"match", "photo.png", "photo.png", "out.bmp", "--model", m}, 2, "out.bmp"},
        {{"apply", "photo.png", "photo.png"}, 2, "missing arguments"},
        {{"apply", "photo.png", "t.json:1", "out.png", "--model", m}, 2, "t.json: no record 1"},
        {{"apply", "photo.png", "t.json:x", "out.png", "--model", m}, 2, "record index"},
        {{"export-cube", "t.json:3", "lut.cube", "--model", m}, 2, "no record 3"},
        {{"export-cube", "t.json", "lut.cube", "--size", "1"}, 2, "--size"},
        {{"export-cube", "t.json", "lut.txt"}, 2, "lut.txt"},
        {{"apply", "photo.png", "t.json", "first.png", "--model", m}, 2, "first.png: already exists"},
        {{"apply", "photo.png", "t.json", "photo.png", "--model", m}, 2, "photo.png: is an input"},
        {{"match", "photo.png", "photo.png", "o.png", "--model", m, "--json", "t.json"}, 2, "t.json: already exists"},
        // Failures exit 1, naming the file.
        {{"suggest", "garbage.jpg", "--model", m, "--faces", "none"}, 1, "garbage.jpg: cannot read image"},
        {{"suggest", "empty.png", "--model", m}, 1, "empty.png: cannot read image"},
        {{"suggest", "absent.png", "--model", m}, 1, "absent.png: no such file"},
        {{"apply", "photo.png", "broken.json", "out.png", "--model", m}, 1, "broken.json: not a valid JSON"},
        {{"apply", "photo.png", "future.json", "out.png", "--model", m}, 1, "format version 9"},
        {{"suggest", "photo.png", "--model", m_work + "/nowhere"}, 1, "nowhere"},
        {{"match", "photo.png", "photo.png", "missing/out.png", "--model", m}, 1, "does not exist"},
        {{"suggest", "huge.png", "--model", m}, 1, "huge.png: 16384 x 16384 is more than 128000000 pixels"},
        {{"apply", "huge.png", "t.json", "o.png", "--model", m, "--max-pixels", "1000"}, 1, "more than 1000 pixels"},
        {{"apply", "photo.png", "t.json", "o.png", "--model", m, "--max-pixels", "0"}, 2, "--max-pixels"},
        {{"match", "half.jpg", "photo.png", "o.png", "--model", m}, 1, "half.jpg: cannot read image (the JPEG file is cut short"}};
    for (const auto& [args, status, mentions] : cases) ExpectRefused(args, status, mentions);
    // --force lets an existing output go.
    const RunResult forced = Run({"apply", "photo.png", "t.json", "first.png", "--model", m, "--force"});
    EXPECT_EQ(forced.status, 0) << forced.err;
}

// =============================================================================
// Results are the library's own
// =============================================================================

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

    const vora::cli::TransferDocument saved = vora::cli::ReadTransfersFile(m_work + "/s/transfers.json");
    ASSERT_EQ(saved.transfers.size(), 3u);
    EXPECT_TRUE(saved.faces.size() == 1 && saved.faces[0].left == 0.3 && saved.faceSource == "given");
    EXPECT_TRUE(saved.rankingFactor == 0.5f && saved.finishFactor == 1.5f && saved.photoWidth == 160u);
    size_t lifted = 3;  // a record that lifts the dark face
    for (size_t k = 0; k < 3; ++k) {
        SCOPED_TRACE(k);
        EXPECT_TRUE(SameRecord(saved.transfers[k], expected[k]));
        const cv::Mat proposal = ReadRgb(m_work + "/s/photo-" + std::to_string(k) + ".png");
        EXPECT_TRUE(SameBytes(proposal, ApplyDirect(m_api, m_photo, expected[k])));
        if (!expected[k].faceCorrections.empty()) lifted = k;
    }
    ASSERT_LT(lifted, 3u) << "the dark face should be lifted by at least one proposal";

    // Previews: the same records, rendered on the photo scaled by area
    // averaging to the long side asked for (160 x 120 -> 100 x 75).
    const RunResult p = Run({"suggest", "photo.png", "--model", m_modelDir, "-n", "3", "--faces", kFace, "--out",
                             "p", "--ranking", "0.5", "--finish", "1.5", "--preview", "100"});
    ASSERT_EQ(p.status, 0) << p.err;
    EXPECT_NE(p.out.find("previews: 100 x 75"), std::string::npos) << p.out;
    cv::Mat preview;
    cv::resize(m_photo, preview, cv::Size(100, 75), 0, 0, cv::INTER_AREA);
    const vora::cli::TransferDocument previewed = vora::cli::ReadTransfersFile(m_work + "/p/transfers.json");
    ASSERT_EQ(previewed.transfers.size(), 3u);
    EXPECT_EQ(previewed.photoWidth, 160u);
    for (size_t k = 0; k < 3; ++k) {
        SCOPED_TRACE(k);
        EXPECT_TRUE(SameRecord(previewed.transfers[k], expected[k]));
        EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/p/photo-" + std::to_string(k) + ".png"),
                              ApplyDirect(m_api, preview, expected[k])));
    }

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

TEST_F(CliTest, MatchGivesTheLibrarysTransfer) {
    cv::Mat style = SyntheticPhotoRgb(90, 200, 3);
    WriteRgb(m_work + "/s.png", style);
    const std::string& m = m_modelDir;
    ASSERT_EQ(Run({"match", "photo.png", "s.png", "m.png", "--model", m, "--solve", "0.5", "--json", "m.json"}).status,
              0);
    ASSERT_EQ(Run({"match", "photo.png", "--style-index", "11", "i.png", "--model", m, "--json", "i.json"}).status, 0);

    vora::VoraParameters params;
    params.solveFactor = 0.5f;
    vora::TRANSFER byImage, byIndex;
    ImageHandle content(m_photo), styleImage(style);
    ASSERT_EQ(m_api.compute_transfer(content.get(), styleImage.get(), byImage, params), vora::STATUS_OK);
    ASSERT_EQ(m_api.compute_transfer(content.get(), 11, byIndex, vora::VoraParameters()), vora::STATUS_OK);
    EXPECT_TRUE(SameRecord(vora::cli::ReadTransfersFile(m_work + "/m.json").transfers[0], byImage));
    EXPECT_TRUE(SameRecord(vora::cli::ReadTransfersFile(m_work + "/i.json").transfers[0], byIndex));
    EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/m.png"), ApplyDirect(m_api, m_photo, byImage)));
    EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/i.png"), ApplyDirect(m_api, m_photo, byIndex)));
}

// =============================================================================
// Transfers JSON
// =============================================================================

TEST(TransferJson, RoundTripIsBitExactForEveryKindOfFloat) {
    auto fromBits = [](uint32_t bits) {
        float f;
        std::memcpy(&f, &bits, 4);
        return f;
    };
    // Specials first: NaNs with sign and payload, infinities, signed zeros,
    // the smallest subnormal, the largest float, a value with no short decimal;
    // then random bit patterns.
    const std::vector<float> specials = {fromBits(0x7fc00000), fromBits(0xffc00001), fromBits(0x7f800001),
                                         INFINITY, -INFINITY, 0.0f, -0.0f, fromBits(1), -fromBits(0x7f7fffff),
                                         0.1f, 1.0f / 3.0f};
    std::mt19937 random(3);
    size_t next = 0;
    auto anyFloat = [&]() { return next < specials.size() ? specials[next++] : fromBits(uint32_t(random())); };
    vora::cli::TransferDocument document;
    for (int r = 0; r < 4; ++r) {
        vora::TRANSFER t;
        t.clusterIndex = r - 1;
        t.styleIndex = 1000 * r - 1;
        float* fields[] = {t.contentMean, t.styleMean, t.chromaMatrix, t.toneCurve, &t.lightnessLow, &t.lightnessHigh};
        const size_t sizes[] = {2, 2, 4, 257, 1, 1};
        for (size_t f = 0; f < 6; ++f) std::generate(fields[f], fields[f] + sizes[f], anyFloat);
        for (int k = 0; k < r; ++k)
            t.faceCorrections.push_back({anyFloat(), anyFloat(), anyFloat(), anyFloat(), anyFloat(), anyFloat(),
                                         anyFloat(), anyFloat()});
        document.transfers.push_back(t);
    }
    document.faces.push_back({0.1, 0.30000000000000004, 1.0 / 3.0, 0.9});
    document.rankingFactor = 0.7f;

    const std::string text = vora::cli::SerializeTransfers(document);
    const vora::cli::TransferDocument back = vora::cli::ParseTransfers(text, "mem.json");
    EXPECT_TRUE(std::equal(back.transfers.begin(), back.transfers.end(), document.transfers.begin(),
                           document.transfers.end(), SameRecord));
    EXPECT_TRUE(back.faces[0].right == 0.30000000000000004 && back.faces[0].top == 1.0 / 3.0);
    EXPECT_EQ(back.rankingFactor, 0.7f);
    EXPECT_EQ(vora::cli::SerializeTransfers(back), text);
}

TEST(TransferJson, MalformedRecordsAreNamed) {
    vora::cli::TransferDocument document;
    document.transfers.resize(2);
    const std::string good = vora::cli::SerializeTransfers(document);
    using json = nlohmann::json;
    using Break = std::pair<std::function<void(json&)>, std::string>;  // change, what the message names
    for (const auto& [change, mentions] : std::vector<Break>{
             {[](json& j) { j["transfers"][0]["toneCurve"].erase(0); },
              "transfers[0].toneCurve: expected an array of 257 numbers"},
             {[](json& j) { j["transfers"][1]["lightnessLow"] = "low"; }, "transfers[1].lightnessLow"},
             {[](json& j) { j["transfers"][1]["faceCorrections"] = json::array({json::object()}); },
              "transfers[1].faceCorrections[0]: missing field \"centreX\""},
             {[](json& j) { j["transfers"][1]["lightnessHigh"] = 1e39; }, "32-bit float"},
             {[](json& j) { j = json::array({1, 2}); }, "not a transfers file"},
             // Read as signed, this wrapped to -1.
             {[](json& j) { j["transfers"][0]["clusterIndex"] = 18446744073709551615ull; },
              "transfers[0].clusterIndex: number out of the 32-bit range"},
             // 20,000 corrections made apply on 512 x 512 take a minute.
             {[](json& j) {
                  json face = {{"centreX", 0.5}, {"centreY", 0.5}, {"halfSizeX", 0.1}, {"halfSizeY", 0.1},
                               {"measuredL", 0.2}, {"measuredA", 1}, {"measuredB", 2}, {"exponent", 0.6}};
                  j["transfers"][0]["faceCorrections"] = json::array();
                  for (int i = 0; i < 257; ++i) j["transfers"][0]["faceCorrections"].push_back(face);
              },
              "transfers[0].faceCorrections: holds 257 face corrections; at most 256 are accepted"}}) {
        json text = json::parse(good);
        change(text);
        EXPECT_THAT([&] { vora::cli::ParseTransfers(text.dump(), "t.json"); },
                    testing::ThrowsMessage<vora::cli::Failure>(testing::HasSubstr(mentions)));
    }
    // A number beyond a double escaped the parser as its own exception, naming no file.
    std::string huge = good;
    const size_t at = huge.find("\"lightnessLow\": ") + 16;
    huge.replace(at, huge.find_first_of(",\n", at) - at, "1e400");
    EXPECT_THAT([&] { vora::cli::ParseTransfers(huge, "t.json"); },
                testing::ThrowsMessage<vora::cli::Failure>(testing::HasSubstr("beyond the range of a double")));
}

// =============================================================================
// output files
// =============================================================================

std::string Contents(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(file), {});
}

size_t Entries(const std::string& folder) {
    return static_cast<size_t>(std::distance(fs::directory_iterator(folder), fs::directory_iterator()));
}

// A file that appears at the output path after the check is never replaced
// without --force (the rename used to replace it and exit 0); with it, it is.
TEST(OutputFiles, TheFinalStepReplacesOnlyWhenAllowed) {
    const vora::fixtures::TempFolder temp;
    const std::string folder = temp.path(), path = folder + "/out.txt";
    vora::fixtures::WriteBytes(path, "the user's");
    EXPECT_THAT([&] { vora::cli::WriteFileAtomically(path, "ours", false); },
                testing::ThrowsMessage<vora::cli::Failure>(testing::HasSubstr("already exists")));
    EXPECT_EQ(Contents(path), "the user's");
    EXPECT_EQ(Entries(folder), 1u);  // no temporary left
    vora::cli::WriteFileAtomically(path, "ours", true);
    EXPECT_EQ(Contents(path), "ours");
}

// A set appears whole or not at all: in a new folder by one rename, in an
// existing one file by file, taken back when one is in the way; abandoned, it
// leaves nothing.
TEST(OutputFiles, StagedSetsAppearTogetherOrNotAtAll) {
    const vora::fixtures::TempFolder temp;
    const std::string root = temp.path(), out = root + "/set";
    {
        vora::cli::StagingFolder abandoned(out);
        vora::cli::WriteFileAtomically(abandoned.PathFor("a.txt"), "a", false);
    }
    EXPECT_EQ(Entries(root), 0u);
    {
        vora::cli::StagingFolder staging(out);
        vora::cli::WriteFileAtomically(staging.PathFor("a.txt"), "a", false);
        vora::cli::WriteFileAtomically(staging.PathFor("b.txt"), "b", false);
        staging.Commit(false);
    }
    EXPECT_TRUE(Contents(out + "/a.txt") == "a" && Contents(out + "/b.txt") == "b" && Entries(root) == 1u);
    fs::remove(out + "/a.txt");
    {
        vora::cli::StagingFolder staging(out);
        vora::cli::WriteFileAtomically(staging.PathFor("a.txt"), "new a", false);
        vora::cli::WriteFileAtomically(staging.PathFor("b.txt"), "new b", false);
        EXPECT_THAT([&] { staging.Commit(false); },
                    testing::ThrowsMessage<vora::cli::Failure>(testing::HasSubstr("nothing was written")));
    }
    EXPECT_TRUE(!fs::exists(out + "/a.txt") && Contents(out + "/b.txt") == "b" && Entries(root) == 1u);
    {
        vora::cli::StagingFolder staging(out);
        vora::cli::WriteFileAtomically(staging.PathFor("b.txt"), "new b", false);
        staging.Commit(true);
    }
    EXPECT_TRUE(Contents(out + "/b.txt") == "new b" && Entries(out) == 1u && Entries(root) == 1u);
    {
        vora::cli::StagingFolder staging(root + "/new/deeper/set");  // parents made as needed
        vora::cli::WriteFileAtomically(staging.PathFor("c.txt"), "c", false);
        staging.Commit(false);
    }
    EXPECT_EQ(Contents(root + "/new/deeper/set/c.txt"), "c");
}

// =============================================================================
// inspect
// =============================================================================

struct BrokenModel {
    std::function<void(FixtureOptions&)> change;
    std::pair<const char*, size_t> truncate;  // a data file and its size, after writing
    const char* mentions;
    const char* suggestSays = nullptr;  // when suggest words it differently
};

TEST_F(CliTest, InspectNamesWhatIsWrongWithEachBrokenModel) {
    using Files = vora::fixtures::NetworkOptions::Files;
    ASSERT_EQ(Run({"match", "photo.png", "photo.png", "first.png", "--model", m_modelDir, "--json", "t.json"}).status, 0);
    const std::vector<BrokenModel> cases = {
        {[](FixtureOptions& o) { o.writeClusters = false; }, {}, "semantic_cluster_1000.dat is missing"},
        {nullptr, {vora::kStyleFileName, 781},
         "styledb_style_1500.dat is truncated: its header promises 1828 bytes, the file has 781"},
        {nullptr, {vora::kScoresFileName, 6}, "too short to hold its header"},
        {[](FixtureOptions& o) { o.scoreColumns = 10; }, {}, "the scores file has 10 columns but there are 12 styles"},
        {[](FixtureOptions& o) { o.transposeScores = true; }, {}, "rows and columns look swapped"},
        {[](FixtureOptions& o) { o.distanceCount = 11; }, {}, "distances file is for 11 styles but there are 12"},
        {[](FixtureOptions& o) { o.network.files = Files::MissingWeights; }, {}, "caffe_reduce_512_model is missing"},
        {[](FixtureOptions& o) { o.network.files = Files::GarbledDefinition; }, {}, "network does not load"},
        {[](FixtureOptions& o) { o.network.outputs = 100; }, {}, "512", "incomplete"},
        {[](FixtureOptions& o) { o.styles[3].lightness[4] = NAN; }, {},
         "styledb_style_1500.dat holds 1 statistics values that are not finite"},
    };
    for (const BrokenModel& c : cases) {
        SCOPED_TRACE(c.mentions);
        FixtureOptions options = vora::fixtures::RandomDatabase(4, 12, 7);
        if (c.change) c.change(options);
        ModelFixture model(options);
        if (c.truncate.first) vora::fixtures::TruncateFile(model.DataFile(c.truncate.first), c.truncate.second);
        const RunResult r = Run({"inspect", model.modelDir()});
        EXPECT_EQ(r.status, 1);
        EXPECT_NE(r.out.find(c.mentions), std::string::npos) << r.out;
        EXPECT_NE(r.out.find("result: broken"), std::string::npos) << r.out;
        EXPECT_EQ(std::count(r.err.begin(), r.err.end(), '\n'), 1) << r.err;
        ExpectRefused({"suggest", "photo.png", "--model", model.modelDir(), "--faces", "none"}, 1,
                      c.suggestSays ? c.suggestSays : c.mentions);
        // With broken data files the network is loaded alone, not through a
        // facade that would read them; apply examines the files before loading.
        if (c.truncate.first) {
            EXPECT_NE(r.out.find("network: loads (no test computation"), std::string::npos) << r.out;
        }
        if (!c.suggestSays) {
            ExpectRefused({"apply", "photo.png", "t.json", "out.png", "--model", model.modelDir()}, 1, c.mentions);
        }
    }

    const RunResult r = Run({"inspect", m_modelDir});
    EXPECT_EQ(r.status, 0) << r.out << r.err;
    for (const char* says : {"result: usable", "4 cluster centres", "best 6 of 12 styles"})
        EXPECT_NE(r.out.find(says), std::string::npos) << r.out;
}

// =============================================================================
// build-model
// =============================================================================

TEST_F(CliTest, BuildModelIsDeterministicAndItsModelWorks) {
    fs::create_directories(m_work + "/styles");
    for (int i = 0; i < 4; ++i)
        WriteRgb(m_work + "/styles/style-" + std::to_string(i) + ".png", SyntheticPhotoRgb(72, 96 + 16 * i, i + 1));
    const RunResult first = Run({"build-model", "--styles", "styles", "--out", "a", "--clusters", "3"});
    ASSERT_EQ(first.status, 0) << first.err;
    EXPECT_NE(first.out.find("3 clusters, 4 styles"), std::string::npos) << first.out;
    ASSERT_EQ(Run({"build-model", "--styles", "styles", "--out", "b/", "--clusters", "3"}).status, 0);
    const std::set<std::string> files = ListTree(m_work + "/a");
    EXPECT_EQ(files.size(), 7u);  // four data files, the net folder and its two files: no staging left behind
    EXPECT_EQ(ListTree(m_work + "/b"), files);
    for (const std::string& name : files) EXPECT_EQ(Slurp(m_work + "/a/" + name), Slurp(m_work + "/b/" + name)) << name;
    EXPECT_EQ(Run({"inspect", "a"}).status, 0);
    EXPECT_EQ(Run({"suggest", "photo.png", "--model", "a", "-n", "2", "--faces", "none"}).status, 0);

    ExpectRefused({"build-model", "--styles", "styles", "--out", "a"}, 2, "a: already holds a model");
    ExpectRefused({"build-model", "--styles", "styles"}, 2, "--out DIR is required");
    ExpectRefused({"build-model", "--styles", "styles", "--out", "c", "--clusters", "0"}, 2, "--clusters");
    ExpectRefused({"build-model", "--styles", "nowhere", "--out", "c"}, 1, "nowhere: no such folder");
    // The builder's own refusal, after the tool's checks: the folder it would
    // have made is gone again.
    ExpectRefused({"build-model", "--styles", "styles", "--out", "c", "--clusters", "999", "--network", "scene"}, 1,
                  "999 clusters");
    const RunResult forced = Run({"build-model", "--styles", "styles", "--out", "a", "--clusters", "2", "--force"});
    EXPECT_EQ(forced.status, 0) << forced.err;
    EXPECT_NE(Slurp(m_work + "/a/" + vora::kClusterFileName), Slurp(m_work + "/b/" + vora::kClusterFileName));
}

// Without the detector's files the default is the scene descriptor, with a
// note on how to fetch them; asking for the detector then is refused.
TEST_F(CliTest, BuildModelChoosesItsNetworkAndSaysHowToFetchTheDetector) {
    fs::create_directories(m_work + "/styles");
    fs::create_directories(m_work + "/empty");
    for (int i = 0; i < 2; ++i)
        WriteRgb(m_work + "/styles/style-" + std::to_string(i) + ".png", SyntheticPhotoRgb(72, 96, i + 1));
    ::setenv("VORA_NETWORK_DIR", (m_work + "/empty").c_str(), 1);
    const RunResult byDefault = Run({"build-model", "--styles", "styles", "--out", "a"});
    ExpectRefused({"build-model", "--styles", "styles", "--out", "b", "--network", "nanodet"}, 1,
                  "fetch them with 'bash scripts/fetch-network.sh'");
    ::unsetenv("VORA_NETWORK_DIR");
    EXPECT_EQ(byDefault.status, 0) << byDefault.err;
    EXPECT_NE(byDefault.err.find("bash scripts/fetch-network.sh"), std::string::npos) << byDefault.err;
    EXPECT_NE(Slurp(m_work + "/a/net/deploy2.prototxt").find("vora_scene_descriptor"), std::string::npos);

    ExpectRefused({"build-model", "--styles", "styles", "--out", "b", "--network", "imagenet"}, 2, "nanodet or scene");
    ExpectRefused({"build-model", "--styles", "styles", "--out", "b", "--feature", "x"}, 2, "--feature goes with --tfjs");
    ExpectRefused({"build-model", "--styles", "styles", "--out", "b", "--tfjs", "m.json", "--feature", "x"}, 2,
                  "--tfjs needs --mean");
    ExpectRefused({"build-model", "--styles", "styles", "--out", "b", "--tfjs", "m.json", "--feature", "x", "--mean",
                   "1,2", "--std", "1,1,1", "--crop", "225"},
                  2, "--mean takes three numbers");
}

// =============================================================================
// export-cube
// =============================================================================

TEST_F(CliTest, CubeHoldsTheToolsOwnColoursAtItsLatticePoints) {
    ASSERT_EQ(Run({"suggest", "photo.png", "--model", m_modelDir, "-n", "2", "--faces", kFace, "--out", "s"}).status,
              0);
    vora::TRANSFER colourOnly = vora::cli::ReadTransfersFile(m_work + "/s/transfers.json").transfers[1];
    colourOnly.faceCorrections.clear();  // a lookup table knows only colours
    // At part strength each point is mixed as apply mixes a pixel.
    for (const auto& [size, strength] : std::vector<std::pair<int, std::string>>{{2, "1"}, {17, "1"}, {9, "0.35"}}) {
        SCOPED_TRACE(size);
        const std::string name = "lut" + std::to_string(size) + ".cube";
        ASSERT_EQ(Run({"export-cube", "s/transfers.json:1", name, "--size", std::to_string(size), "--strength",
                       strength})
                      .status,
                  0);
        int declared = 0;
        std::vector<cv::Vec3d> domain, values;
        std::istringstream in(Slurp(m_work + "/" + name));
        for (std::string line, key; std::getline(in, line);) {
            std::istringstream words(line);
            cv::Vec3d v;
            if (std::istringstream(line) >> v[0] >> v[1] >> v[2]) values.push_back(v);
            else if (words >> key && key == "LUT_3D_SIZE") words >> declared;
            else if (key.rfind("DOMAIN_", 0) == 0 && words >> v[0] >> v[1] >> v[2]) domain.push_back(v);
        }
        EXPECT_EQ(declared, size);
        EXPECT_EQ(domain, (std::vector<cv::Vec3d>{{0, 0, 0}, {1, 1, 1}}));

        // The library's rendering of each lattice colour, red varying fastest.
        std::vector<cv::Vec3b> lattice;
        auto level = [&](int k) { return static_cast<uint8_t>(std::lround(255.0 * k / (size - 1))); };
        for (int b = 0; b < size; ++b)
            for (int g = 0; g < size; ++g)
                for (int r = 0; r < size; ++r) lattice.emplace_back(level(r), level(g), level(b));
        cv::Mat bytes;
        cv::Mat(values).convertTo(bytes, CV_8U, 255.0);  // each value is a byte / 255, to seven decimals
        EXPECT_TRUE(SameBytes(bytes, Mixed(cv::Mat(lattice), ApplyDirect(m_api, cv::Mat(lattice), colourOnly),
                                           std::stod(strength))));
    }
}

TEST_F(CliTest, StrengthMixesEachByteWithTheOriginal) {
    ASSERT_EQ(Run({"match", "photo.png", "photo.png", "first.png", "--model", m_modelDir, "--json", "t.json"}).status, 0);
    const vora::TRANSFER t = vora::cli::ReadTransfersFile(m_work + "/t.json").transfers[0];
    const cv::Mat full = ApplyDirect(m_api, m_photo, t);
    for (const char* strength : {"0", "0.35", "1"}) {
        SCOPED_TRACE(strength);
        const std::string out = std::string("s") + strength + ".png";
        const RunResult r = Run({"apply", "photo.png", "t.json", out, "--strength", strength});
        ASSERT_EQ(r.status, 0) << r.err;
        EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/" + out), Mixed(m_photo, full, std::stod(strength))));
    }
    ASSERT_FALSE(SameBytes(full, m_photo));  // so that strength 0 is a real test
    for (const char* bad : {"1.5", "-0.1", "nan", "half"})
        ExpectRefused({"apply", "photo.png", "t.json", "o.png", "--strength", bad}, 2, "--strength");
}

}  // namespace
