// End-to-end tests of the vora command-line tool: the executable is run on
// fixture models and generated photos, and what it writes is compared with
// direct calls of libvora.

#include <vora/vora.h>

#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <random>
#include <set>
#include <sstream>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>
#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include "model/StyleDatabase.h"
#include "support/ModelFixtures.h"
#include "support/TestImages.h"
#include "vora/Cli.h"
#include "vora/TransferJson.h"

namespace {

namespace fs = std::filesystem;
using vora::fixtures::FixtureOptions;
using vora::fixtures::ModelFixture;
using vora::fixtures::RandomDatabase;

// =============================================================================
// Running the tool
// =============================================================================

struct RunResult {
    int status = -1;
    std::string out;
    std::string err;
};

std::string Slurp(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    std::ostringstream s;
    s << in.rdbuf();
    return s.str();
}

// Runs the tool in folder cwd; its output is captured outside that folder so
// that the folder's contents are only what the tool wrote.
RunResult RunVora(const std::string& cwd, const std::vector<std::string>& args) {
    static const std::string captureDir = vora::fixtures::MakeTempFolder();
    const std::string outPath = captureDir + "/out", errPath = captureDir + "/err";
    const pid_t pid = fork();
    if (pid == 0) {
        if (chdir(cwd.c_str()) != 0) _exit(127);
        FILE* out = std::freopen(outPath.c_str(), "w", stdout);
        FILE* err = std::freopen(errPath.c_str(), "w", stderr);
        if (!out || !err) _exit(127);
        unsetenv("VORA_MODEL");
        std::vector<char*> argv;
        argv.push_back(const_cast<char*>(VORA_CLI_PATH));
        for (const std::string& a : args) argv.push_back(const_cast<char*>(a.c_str()));
        argv.push_back(nullptr);
        execv(VORA_CLI_PATH, argv.data());
        _exit(127);
    }
    int wstatus = 0;
    waitpid(pid, &wstatus, 0);
    RunResult r;
    r.status = WIFEXITED(wstatus) ? WEXITSTATUS(wstatus) : 128 + WTERMSIG(wstatus);
    r.out = Slurp(outPath);
    r.err = Slurp(errPath);
    return r;
}

std::set<std::string> ListTree(const std::string& root) {
    std::set<std::string> files;
    for (const auto& entry : fs::recursive_directory_iterator(root))
        files.insert(fs::relative(entry.path(), root).string());
    return files;
}

// A photo with gradients in every direction and a darker, warm patch where a
// face would be, so that proposals differ and face correction has work.
cv::Mat TestPhotoRgb(int width = 160, int height = 120) {
    cv::Mat rgb(height, width, CV_8UC3);
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x) {
            uint8_t* p = rgb.ptr<uint8_t>(y) + 3 * x;
            p[0] = static_cast<uint8_t>(30 + 200 * x / width);
            p[1] = static_cast<uint8_t>(40 + 150 * y / height);
            p[2] = static_cast<uint8_t>(220 - 180 * (x + y) / (width + height));
            const bool face = x > width * 0.4 && x < width * 0.6 && y > height * 0.3 && y < height * 0.7;
            if (face) {
                p[0] = static_cast<uint8_t>(90 + (x * 7 + y * 3) % 20);
                p[1] = static_cast<uint8_t>(60 + (x * 5 + y * 11) % 16);
                p[2] = static_cast<uint8_t>(45 + (x * 3 + y * 5) % 12);
            }
        }
    return rgb;
}

void WriteRgb(const std::string& path, const cv::Mat& rgbOrGrey) {
    cv::Mat bgr = rgbOrGrey.clone();
    if (bgr.channels() > 1) cv::cvtColor(bgr, bgr, bgr.channels() == 4 ? cv::COLOR_RGBA2BGRA : cv::COLOR_RGB2BGR);
    ASSERT_TRUE(cv::imwrite(path, bgr));
}

cv::Mat ReadRgb(const std::string& path) {
    cv::Mat bgr = cv::imread(path, cv::IMREAD_UNCHANGED);
    if (bgr.empty()) return bgr;
    cv::Mat rgb;
    cv::cvtColor(bgr, rgb, bgr.channels() == 4 ? cv::COLOR_BGRA2RGBA : cv::COLOR_BGR2RGB);
    return rgb;
}

bool SameBytes(const cv::Mat& a, const cv::Mat& b) {
    return a.size() == b.size() && a.type() == b.type() && cv::norm(a, b, cv::NORM_INF) == 0.0;
}


// A library image over the pixels of rgb.
std::unique_ptr<vora::IImage, void (*)(vora::IImage*)> Wrap(cv::Mat& rgb) {
    static const size_t layout[4] = {0, 0, 0, 0};
    const size_t w = static_cast<size_t>(rgb.cols), h = static_cast<size_t>(rgb.rows);
    return {vora::CreateImageObj(h, w, static_cast<size_t>(rgb.channels()), layout, rgb.data,
                                 vora::CFullResImageSize(w, h), vora::CTopLeftCoordinate(0, 0)),
            vora::DestroyImageObj};
}

// Library result for a whole image, the reference every rendering is held to.
cv::Mat ApplyDirect(const vora::vora_api& api, const cv::Mat& pixels, const vora::TRANSFER& t) {
    cv::Mat out = pixels.clone();
    auto image = Wrap(out);
    EXPECT_EQ(api.apply_transfer(image.get(), t, image.get()), vora::STATUS_OK);
    return out;
}

// A work folder holding a fixture model and a test photo.
class CliTest : public ::testing::Test {
protected:
    void SetUp() override {
        m_work = vora::fixtures::MakeTempFolder();
        m_photo = TestPhotoRgb();
        WriteRgb(m_work + "/photo.png", m_photo);
    }
    void TearDown() override { vora::fixtures::RemoveTree(m_work); }

    RunResult Run(const std::vector<std::string>& args) { return RunVora(m_work, args); }

    // Runs a command that must be refused: its status, a single line on
    // standard error that starts with "vora: " and contains `mentions`, and
    // the work folder unchanged.
    void ExpectRefused(const std::vector<std::string>& args, int status, const std::string& mentions) {
        const std::set<std::string> before = ListTree(m_work);
        const RunResult r = Run(args);
        std::string joined;
        for (const std::string& a : args) joined += a + " ";
        SCOPED_TRACE(joined);
        EXPECT_EQ(r.status, status) << r.err;
        EXPECT_EQ(r.err.rfind("vora: ", 0), 0u) << r.err;
        EXPECT_EQ(std::count(r.err.begin(), r.err.end(), '\n'), 1) << r.err;
        EXPECT_NE(r.err.find(mentions), std::string::npos) << r.err;
        EXPECT_EQ(ListTree(m_work), before);
    }

    std::string m_work;
    cv::Mat m_photo;
};

FixtureOptions SmallDatabase() { return RandomDatabase(4, 12, 7); }

// =============================================================================
// Bad input: message, exit status, nothing written
// =============================================================================

TEST_F(CliTest, BadInputGetsItsMessageAndStatusAndWritesNothing) {
    ModelFixture model(SmallDatabase());
    const std::string m = model.modelDir();
    ASSERT_EQ(Run({"match", "photo.png", "photo.png", "first.png", "--model", m, "--json", "t.json"}).status, 0);
    vora::fixtures::WriteBytes(m_work + "/garbage.jpg", "this is not a picture");
    vora::fixtures::WriteBytes(m_work + "/empty.png", "");
    vora::fixtures::WriteBytes(m_work + "/broken.json", "{\"format\": \"vora-transfers\", ");
    vora::fixtures::WriteBytes(m_work + "/future.json", "{\"format\": \"vora-transfers\", \"version\": 9}");
    vora::fixtures::WriteBytes(m_work + "/other.json", "{\"name\": 1}");
    using Case = std::tuple<std::vector<std::string>, int, std::string>;  // arguments, status, mentions
    const std::vector<Case> cases = {
        // Usage errors exit 2.
        {{}, 2, "no command given"},
        {{"resize"}, 2, "unknown command 'resize'"},
        {{"suggest", "photo.png", "--model", m, "--colour", "red"}, 2, "unknown option --colour"},
        {{"suggest", "photo.png", "--model", m, "-n", "0"}, 2, "-n"},
        {{"suggest", "photo.png", "--model", m, "-n", "five"}, 2, "-n"},
        {{"suggest", "photo.png", "--model", m, "-n", "101"}, 2, "-n"},
        // 12 styles: the library keeps the better 6 per cluster.
        {{"suggest", "photo.png", "--model", m, "-n", "7"}, 2, "6 styles"},
        {{"suggest", "photo.png", "--model", m, "--ranking", "nan"}, 2, "--ranking"},
        {{"suggest", "photo.png", "--model", m, "--ranking", "-1"}, 2, "--ranking"},
        {{"suggest", "photo.png", "--model", m, "--solve", "0"}, 2, "--solve"},
        {{"suggest", "photo.png", "--model", m, "--limit", "inf"}, 2, "--limit"},
        {{"suggest", "photo.png", "--model", m, "--finish", "3"}, 2, "--finish"},
        {{"suggest", "photo.png", "--model", m, "--faces", "0.6,0.4,0.1,0.5"}, 2, "0.6,0.4,0.1,0.5"},
        {{"suggest", "photo.png", "--model", m, "--faces", "0.1,0.4,0.5,1.5"}, 2, "--faces"},
        {{"suggest", "photo.png", "--model", m, "--faces", "0.1,0.4"}, 2, "--faces"},
        {{"suggest", "photo.png", "--model", m, "--faces", "auto", "--faces", "0.1,0.4,0.1,0.4"}, 2, "auto"},
        {{"match", "photo.png", "--style-index", "12", "out.png", "--model", m}, 2, "--style-index"},
        {{"match", "photo.png", "photo.png", "photo.png", "--model", m}, 2, "photo.png: is an input"},
        {{"match", "photo.png", "photo.png", "out.bmp", "--model", m}, 2, "out.bmp"},
        {{"apply", "photo.png", "photo.png"}, 2, "missing arguments"},
        {{"apply", "photo.png", "t.json:1", "out.png", "--model", m}, 2, "t.json: no record 1"},
        {{"apply", "photo.png", "t.json:x", "out.png", "--model", m}, 2, "record index"},
        {{"export-cube", "t.json:3", "lut.cube", "--model", m}, 2, "no record 3"},
        {{"export-cube", "t.json", "lut.cube", "--size", "1"}, 2, "--size"},
        {{"export-cube", "t.json", "lut.txt"}, 2, "lut.txt"},
        {{"apply", "photo.png", "t.json", "first.png", "--model", m}, 2, "first.png: already exists"},
        {{"apply", "photo.png", "t.json", "photo.png", "--model", m}, 2, "photo.png: is an input"},
        {{"match", "photo.png", "photo.png", "again.png", "--model", m, "--json", "t.json"}, 2,
         "t.json: already exists"},
        // Failures exit 1, naming the file.
        {{"suggest", "garbage.jpg", "--model", m, "--faces", "none"}, 1, "garbage.jpg: cannot read image"},
        {{"suggest", "empty.png", "--model", m}, 1, "empty.png: cannot read image"},
        {{"suggest", "absent.png", "--model", m}, 1, "absent.png: no such file"},
        {{"match", "photo.png", "garbage.jpg", "out.png", "--model", m}, 1, "garbage.jpg"},
        {{"apply", "photo.png", "broken.json", "out.png", "--model", m}, 1, "broken.json: not a valid JSON"},
        {{"apply", "photo.png", "future.json", "out.png", "--model", m}, 1, "format version 9"},
        {{"apply", "photo.png", "other.json", "out.png", "--model", m}, 1, "not a transfers file"},
        {{"suggest", "photo.png", "--model", m_work + "/nowhere"}, 1, "nowhere"},
        {{"match", "photo.png", "photo.png", "missing/out.png", "--model", m}, 1, "does not exist"}};
    for (const auto& [args, status, mentions] : cases) ExpectRefused(args, status, mentions);
    // --force lets an existing output go.
    const RunResult forced = Run({"apply", "photo.png", "t.json", "first.png", "--model", m, "--force"});
    EXPECT_EQ(forced.status, 0) << forced.err;
}

// =============================================================================
// Results are the library's own
// =============================================================================

TEST_F(CliTest, SuggestAndApplyGiveTheLibrarysBytesAndRecords) {
    ModelFixture model(SmallDatabase());
    const std::string m = model.modelDir();
    const RunResult r = Run({"suggest", "photo.png", "--model", m, "-n", "3", "--faces", "0.375,0.625,0.25,0.75",
                             "--out", "sugg", "--ranking", "0.5", "--finish", "1.5"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(ListTree(m_work + "/sugg"), (std::set<std::string>{"photo-0.png", "photo-1.png", "photo-2.png",
                                                                 "contact-sheet.png", "transfers.json"}));

    vora::vora_api api(m);
    const vora::CFaceRect face(0.375, 0.625, 0.25, 0.75);
    vora::VoraParameters params;
    params.numTransfers = 3;
    params.rankingFactor = 0.5f;
    params.finishFactor = 1.5f;
    params.faceRects = &face;
    params.numFaceRects = 1;
    std::vector<vora::TRANSFER> expected(3);
    cv::Mat rgb = m_photo.clone();
    ASSERT_EQ(api.compute_transfers(Wrap(rgb).get(), expected, params), vora::STATUS_OK);

    const vora::cli::TransferDocument saved = vora::cli::ReadTransfersFile(m_work + "/sugg/transfers.json");
    ASSERT_EQ(saved.transfers.size(), 3u);
    ASSERT_EQ(saved.faces.size(), 1u);
    EXPECT_EQ(saved.faces[0].left, 0.375);
    EXPECT_EQ(saved.faceSource, "given");
    EXPECT_EQ(saved.rankingFactor, 0.5f);
    EXPECT_EQ(saved.finishFactor, 1.5f);
    EXPECT_EQ(saved.photoWidth, 160u);
    bool anyFaceLifted = false;
    for (size_t k = 0; k < 3; ++k) {
        SCOPED_TRACE(k);
        EXPECT_TRUE(vora::testimages::SameRecord(saved.transfers[k], expected[k]));
        anyFaceLifted = anyFaceLifted || !expected[k].faceCorrections.empty();
        const cv::Mat want = ApplyDirect(api, m_photo, expected[k]);
        EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/sugg/photo-" + std::to_string(k) + ".png"), want));
        const std::string out = "applied-" + std::to_string(k) + ".png";
        const RunResult a = Run({"apply", "photo.png", "sugg/transfers.json:" + std::to_string(k), out});
        ASSERT_EQ(a.status, 0) << a.err;  // the model comes from the file
        EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/" + out), want));
    }
    EXPECT_TRUE(anyFaceLifted) << "the dark face patch should be lifted by at least one proposal";
    const cv::Mat sheet = ReadRgb(m_work + "/sugg/contact-sheet.png");
    EXPECT_GT(sheet.cols, 2 * 160);
}

TEST_F(CliTest, EveryKindOfPhotoIsAppliedToTheLibrarysBytes) {
    ModelFixture model(SmallDatabase());
    ASSERT_EQ(Run({"suggest", "photo.png", "--model", model.modelDir(), "-n", "1", "--faces", "0.4,0.6,0.3,0.7",
                   "--out", "s"})
                  .status,
              0);
    const vora::TRANSFER t = vora::cli::ReadTransfersFile(m_work + "/s/transfers.json").transfers[0];
    ASSERT_FALSE(t.faceCorrections.empty());  // position-dependent, so bands must place it right
    vora::vora_api api(model.modelDir());

    cv::Mat rgba, alpha(m_photo.size(), CV_8U), grey, greyRgb, deep;
    cv::randu(alpha, 0, 256);
    cv::merge(std::vector<cv::Mat>{m_photo, alpha}, rgba);
    cv::cvtColor(m_photo, grey, cv::COLOR_RGB2GRAY);
    cv::cvtColor(grey, greyRgb, cv::COLOR_GRAY2RGB);
    m_photo.convertTo(deep, CV_16U, 257.0);  // every 16-bit value an exact multiple of 257
    const cv::Mat big = TestPhotoRgb(2300, 900);  // bands of 455 rows, the last one short
    // The file as written, and the pixels the library is to be given.
    for (const auto& [name, written, pixels] : std::vector<std::tuple<std::string, cv::Mat, cv::Mat>>{
             {"big.png", big, big}, {"rgba.png", rgba, rgba}, {"grey.png", grey, greyRgb}, {"deep.png", deep, m_photo}}) {
        WriteRgb(m_work + "/" + name, written);
        const RunResult r = Run({"apply", name, "s/transfers.json", "out-" + name});
        ASSERT_EQ(r.status, 0) << r.err;
        EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/out-" + name), ApplyDirect(api, pixels, t))) << name;
        EXPECT_EQ(r.err.find("16-bit samples reduced to 8 bits") != std::string::npos, name == "deep.png") << r.err;
    }
    cv::Mat alphaOut;
    cv::extractChannel(ReadRgb(m_work + "/out-rgba.png"), alphaOut, 3);
    EXPECT_TRUE(SameBytes(alphaOut, alpha));
}

TEST_F(CliTest, MatchGivesTheLibrarysTransfer) {
    ModelFixture model(SmallDatabase());
    const std::string m = model.modelDir();
    cv::Mat style = TestPhotoRgb(90, 200);
    cv::flip(style, style, 1);
    style = style * 0.6;
    WriteRgb(m_work + "/style.png", style);
    ASSERT_EQ(Run({"match", "photo.png", "style.png", "m.png", "--model", m, "--solve", "0.5", "--json", "m.json"})
                  .status,
              0);
    ASSERT_EQ(Run({"match", "photo.png", "--style-index", "11", "i.png", "--model", m, "--json", "i.json"}).status, 0);

    vora::vora_api api(m);
    cv::Mat content = m_photo.clone();
    vora::VoraParameters params;
    params.solveFactor = 0.5f;
    vora::TRANSFER byImage, byIndex;
    ASSERT_EQ(api.compute_transfer(Wrap(content).get(), Wrap(style).get(), byImage, params), vora::STATUS_OK);
    ASSERT_EQ(api.compute_transfer(Wrap(content).get(), 11, byIndex, vora::VoraParameters()), vora::STATUS_OK);

    EXPECT_TRUE(vora::testimages::SameRecord(vora::cli::ReadTransfersFile(m_work + "/m.json").transfers[0], byImage));
    EXPECT_TRUE(vora::testimages::SameRecord(vora::cli::ReadTransfersFile(m_work + "/i.json").transfers[0], byIndex));
    EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/m.png"), ApplyDirect(api, m_photo, byImage)));
    EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/i.png"), ApplyDirect(api, m_photo, byIndex)));
}

// =============================================================================
// Transfers JSON
// =============================================================================

TEST(TransferJson, RoundTripIsBitExactForEveryKindOfFloat) {
    std::mt19937 random(3);
    auto fromBits = [](uint32_t bits) {
        float f;
        std::memcpy(&f, &bits, 4);
        return f;
    };
    auto anyFloat = [&]() { return fromBits(static_cast<uint32_t>(random())); };
    // Specials first: NaNs with sign and payload, infinities, signed zeros,
    // the smallest subnormal, the largest float, a value with no short decimal.
    const std::vector<float> specials = {fromBits(0x7fc00000), fromBits(0xffc00001), fromBits(0x7f800001),
                                         INFINITY, -INFINITY, 0.0f, -0.0f, fromBits(1), -fromBits(0x7f7fffff),
                                         0.1f, 1.0f / 3.0f};
    vora::cli::TransferDocument document;
    for (int r = 0; r < 4; ++r) {
        vora::TRANSFER t;
        t.clusterIndex = r - 1;
        t.styleIndex = 1000 * r - 1;
        float* fields[] = {t.contentMean, t.styleMean, t.chromaMatrix, t.toneCurve, &t.lightnessLow, &t.lightnessHigh};
        const size_t sizes[] = {2, 2, 4, 257, 1, 1};
        size_t special = 0;
        for (size_t f = 0; f < 6; ++f)
            for (size_t i = 0; i < sizes[f]; ++i)
                fields[f][i] = (r == 0 && special < specials.size()) ? specials[special++] : anyFloat();
        for (int k = 0; k < r; ++k)
            t.faceCorrections.push_back({anyFloat(), anyFloat(), anyFloat(), anyFloat(), anyFloat(), anyFloat(),
                                         anyFloat(), specials[static_cast<size_t>(k)]});
        document.transfers.push_back(t);
    }
    document.faces.push_back({0.1, 0.30000000000000004, 1.0 / 3.0, 0.9});
    document.rankingFactor = 0.7f;

    const std::string text = vora::cli::SerializeTransfers(document);
    const vora::cli::TransferDocument back = vora::cli::ParseTransfers(text, "mem.json");
    ASSERT_EQ(back.transfers.size(), document.transfers.size());
    for (size_t r = 0; r < back.transfers.size(); ++r) EXPECT_TRUE(vora::testimages::SameRecord(back.transfers[r], document.transfers[r]));
    EXPECT_EQ(back.faces[0].right, 0.30000000000000004);
    EXPECT_EQ(back.faces[0].top, 1.0 / 3.0);
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
             {[](json& j) { j = json::array({1, 2}); }, "not a transfers file"}}) {
        json text = json::parse(good);
        change(text);
        try {
            vora::cli::ParseTransfers(text.dump(), "t.json");
            ADD_FAILURE() << "accepted: " << mentions;
        } catch (const vora::cli::Failure& e) {
            EXPECT_NE(std::string(e.what()).find(mentions), std::string::npos) << e.what();
        }
    }
}

// =============================================================================
// inspect
// =============================================================================

struct BrokenModel {
    const char* name;
    std::function<void(FixtureOptions&)> change;
    std::function<void(const ModelFixture&)> damage;  // after writing
    const char* mentions;
    const char* suggestSays = nullptr;  // when suggest words it differently
};

TEST_F(CliTest, InspectNamesWhatIsWrongWithEachBrokenModel) {
    using Files = vora::fixtures::NetworkOptions::Files;
    const std::vector<BrokenModel> cases = {
        {"missing styles", [](FixtureOptions& o) { o.writeStyles = false; }, nullptr, "styledb_style_1500.dat is missing"},
        {"missing clusters", [](FixtureOptions& o) { o.writeClusters = false; }, nullptr,
         "semantic_cluster_1000.dat is missing"},
        {"missing distances", [](FixtureOptions& o) { o.writeDistances = false; }, nullptr,
         "styledb_fdist_1500.dat is missing"},
        {"truncated styles", nullptr,
         [](const ModelFixture& f) {
             vora::fixtures::TruncateFile(f.DataFile(vora::kStyleFileName), 4 + 152 * 5 + 17);
         },
         "styledb_style_1500.dat is truncated: its header promises 1828 bytes, the file has 781"},
        {"header only", nullptr,
         [](const ModelFixture& f) { vora::fixtures::TruncateFile(f.DataFile(vora::kScoresFileName), 6); },
         "too short to hold its header"},
        {"score columns", [](FixtureOptions& o) { o.scoreColumns = 10; }, nullptr,
         "the scores file has 10 columns but there are 12 styles"},
        {"swapped scores", [](FixtureOptions& o) { o.transposeScores = true; }, nullptr,
         "rows and columns look swapped"},
        {"distance count", [](FixtureOptions& o) { o.distanceCount = 11; }, nullptr,
         "the distances file is for 11 styles but there are 12 styles"},
        {"no network", [](FixtureOptions& o) { o.network.files = Files::None; }, nullptr,
         "net/deploy2.prototxt is missing"},
        {"no weights", [](FixtureOptions& o) { o.network.files = Files::MissingWeights; }, nullptr,
         "net/caffe_reduce_512_model is missing"},
        {"garbled definition", [](FixtureOptions& o) { o.network.files = Files::GarbledDefinition; }, nullptr,
         "the network does not load", "network does not load"},
        {"short feature", [](FixtureOptions& o) { o.network.outputs = 100; }, nullptr, "512", "incomplete"},
        {"not a number", [](FixtureOptions& o) { o.styles[3].lightness[4] = NAN; }, nullptr,
         "styledb_style_1500.dat holds 1 statistics values that are not finite"},
    };
    for (const BrokenModel& c : cases) {
        SCOPED_TRACE(c.name);
        FixtureOptions options = SmallDatabase();
        if (c.change) c.change(options);
        ModelFixture model(options);
        if (c.damage) c.damage(model);
        const RunResult r = Run({"inspect", model.modelDir()});
        EXPECT_EQ(r.status, 1);
        EXPECT_NE(r.out.find(c.mentions), std::string::npos) << r.out;
        EXPECT_NE(r.out.find("result: broken"), std::string::npos) << r.out;
        EXPECT_EQ(std::count(r.err.begin(), r.err.end(), '\n'), 1) << r.err;
        ExpectRefused({"suggest", "photo.png", "--model", model.modelDir(), "--faces", "none"}, 1,
                      c.suggestSays ? c.suggestSays : c.mentions);
    }

    ModelFixture good(SmallDatabase());
    const RunResult r = Run({"inspect", good.modelDir()});
    EXPECT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("result: usable"), std::string::npos) << r.out;
    EXPECT_NE(r.out.find("4 cluster centres"), std::string::npos) << r.out;
    EXPECT_NE(r.out.find("best 6 of 12 styles"), std::string::npos) << r.out;
}

// =============================================================================
// build-model
// =============================================================================

// Four small style photos with different casts and tones.
void WriteStylePhotos(const std::string& folder) {
    fs::create_directories(folder);
    const cv::Vec3f casts[] = {{1.2f, 0.9f, 0.6f}, {0.6f, 0.9f, 1.3f}, {0.8f, 1.2f, 0.7f}, {1.0f, 1.0f, 1.0f}};
    for (int i = 0; i < 4; ++i) {
        cv::Mat rgb = TestPhotoRgb(96 + 16 * i, 72);
        rgb.forEach<cv::Vec3b>([&](cv::Vec3b& p, const int*) {
            for (int c = 0; c < 3; ++c) p[c] = cv::saturate_cast<uint8_t>(p[c] * casts[i][c] * (0.7f + 0.2f * i));
        });
        WriteRgb(folder + "/style-" + std::to_string(i) + ".png", rgb);
    }
}

TEST_F(CliTest, BuildModelIsDeterministicAndItsModelWorks) {
    WriteStylePhotos(m_work + "/styles");
    const RunResult first = Run({"build-model", "--styles", "styles", "--out", "a", "--clusters", "3"});
    ASSERT_EQ(first.status, 0) << first.err;
    EXPECT_NE(first.out.find("3 clusters, 4 styles"), std::string::npos) << first.out;
    ASSERT_EQ(Run({"build-model", "--styles", "styles", "--out", "b/", "--clusters", "3"}).status, 0);
    for (const char* name : {vora::kClusterFileName, vora::kStyleFileName, vora::kScoresFileName,
                             vora::kDistanceFileName, "net/deploy2.prototxt", "net/caffe_reduce_512_model"}) {
        SCOPED_TRACE(name);
        const std::string a = Slurp(m_work + "/a/" + name);
        EXPECT_FALSE(a.empty());
        EXPECT_EQ(a, Slurp(m_work + "/b/" + name));
    }
    EXPECT_EQ(ListTree(m_work + "/a"), ListTree(m_work + "/b"));  // no staging left behind

    const RunResult inspect = Run({"inspect", "a"});
    EXPECT_EQ(inspect.status, 0) << inspect.out;
    const RunResult suggest = Run({"suggest", "photo.png", "--model", "a", "-n", "2", "--faces", "none"});
    EXPECT_EQ(suggest.status, 0) << suggest.err;

    ExpectRefused({"build-model", "--styles", "styles", "--out", "a"}, 2, "a: already holds a model");
    ExpectRefused({"build-model", "--styles", "styles"}, 2, "--out DIR is required");
    ExpectRefused({"build-model", "--styles", "styles", "--out", "c", "--clusters", "0"}, 2, "--clusters");
    ExpectRefused({"build-model", "--styles", "nowhere", "--out", "c"}, 1, "nowhere: no such folder");
    // The builder's own refusal, after the tool's checks: the folder it would
    // have made is gone again.
    ExpectRefused({"build-model", "--styles", "styles", "--out", "c", "--clusters", "999"}, 1, "999 clusters");
    const RunResult forced = Run({"build-model", "--styles", "styles", "--out", "a", "--clusters", "2", "--force"});
    EXPECT_EQ(forced.status, 0) << forced.err;
    EXPECT_NE(Slurp(m_work + "/a/" + vora::kClusterFileName), Slurp(m_work + "/b/" + vora::kClusterFileName));
}

// =============================================================================
// export-cube
// =============================================================================

struct Cube {
    int size = 0;
    std::vector<cv::Vec3d> domain;
    std::vector<cv::Vec3d> values;
};

Cube ReadCube(const std::string& path) {
    Cube cube;
    std::istringstream in(Slurp(path));
    for (std::string line; std::getline(in, line);) {
        std::istringstream words(line);
        std::string key;
        cv::Vec3d v;
        if (words >> key && key == "LUT_3D_SIZE") words >> cube.size;
        if (key.rfind("DOMAIN_", 0) == 0 && words >> v[0] >> v[1] >> v[2]) cube.domain.push_back(v);
        if (std::istringstream(line) >> v[0] >> v[1] >> v[2]) cube.values.push_back(v);
    }
    return cube;
}

TEST_F(CliTest, CubeHoldsTheToolsOwnColoursAtItsLatticePoints) {
    ModelFixture model(SmallDatabase());
    ASSERT_EQ(Run({"suggest", "photo.png", "--model", model.modelDir(), "-n", "2", "--faces", "0.375,0.625,0.25,0.75",
                   "--out", "s"})
                  .status,
              0);
    const vora::cli::TransferDocument document = vora::cli::ReadTransfersFile(m_work + "/s/transfers.json");
    vora::vora_api api(model.modelDir());
    for (int size : {2, 17}) {
        SCOPED_TRACE(size);
        const std::string name = "lut" + std::to_string(size) + ".cube";
        const RunResult r = Run({"export-cube", "s/transfers.json:1", name, "--size", std::to_string(size)});
        ASSERT_EQ(r.status, 0) << r.err;
        const Cube cube = ReadCube(m_work + "/" + name);
        ASSERT_EQ(cube.size, size);
        EXPECT_EQ(cube.domain, (std::vector<cv::Vec3d>{{0, 0, 0}, {1, 1, 1}}));
        ASSERT_EQ(cube.values.size(), static_cast<size_t>(size * size * size));

        // The tool's own colours: the photo-independent part of the transfer
        // (no face lift) applied to each lattice colour, red varying fastest.
        vora::TRANSFER colourOnly = document.transfers[1];
        colourOnly.faceCorrections.clear();
        size_t i = 0, mismatches = 0;
        for (int b = 0; b < size; ++b)
            for (int g = 0; g < size; ++g)
                for (int r0 = 0; r0 < size; ++r0, ++i) {
                    auto level = [&](int k) { return static_cast<uint8_t>(std::lround(255.0 * k / (size - 1))); };
                    cv::Mat pixel(1, 1, CV_8UC3, cv::Scalar(level(r0), level(g), level(b)));
                    const cv::Vec3b want = ApplyDirect(api, pixel, colourOnly).at<cv::Vec3b>(0, 0);
                    for (int c = 0; c < 3; ++c)
                        if (std::lround(cube.values[i][c] * 255.0) != want[c]) ++mismatches;
                }
        EXPECT_EQ(mismatches, 0u);
    }
}

}  // namespace
