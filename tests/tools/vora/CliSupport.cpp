#include "tools/vora/CliSupport.h"

#include <sys/wait.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <filesystem>

#include <lcms2.h>
#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"
#include <exiv2/exiv2.hpp>
#pragma GCC diagnostic pop

namespace vora {
namespace clitest {

namespace fs = std::filesystem;

RunResult RunVora(const std::string& cwd, const std::vector<std::string>& args) {
    static const fixtures::TempFolder folder;
    const std::string& capture = folder.path();
    std::string command = "cd '" + cwd + "' && exec env -u VORA_MODEL '" VORA_CLI_PATH "'";
    for (const std::string& a : args) command += " '" + a + "'";  // no test argument holds a quote
    const int status = std::system((command + " >" + capture + "/out 2>" + capture + "/err").c_str());
    return {WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status), ReadBytes(capture + "/out"),
            ReadBytes(capture + "/err")};
}

std::set<std::string> ListTree(const std::string& root) {
    std::set<std::string> files;
    for (const auto& entry : fs::recursive_directory_iterator(root))
        files.insert(fs::relative(entry.path(), root).string());
    return files;
}

void WriteRgb(const std::string& path, const cv::Mat& rgbOrGrey) {
    cv::Mat bgr = rgbOrGrey.clone();
    if (bgr.channels() > 1) cv::cvtColor(bgr, bgr, bgr.channels() == 4 ? cv::COLOR_RGBA2BGRA : cv::COLOR_RGB2BGR);
    ASSERT_TRUE(cv::imwrite(path, bgr));
}

cv::Mat ReadRgb(const std::string& path) {
    cv::Mat image = cv::imread(path, cv::IMREAD_UNCHANGED);
    cv::cvtColor(image, image, image.channels() == 4 ? cv::COLOR_BGRA2RGBA : cv::COLOR_BGR2RGB);
    return image;
}

void CliTest::ExpectRefused(const std::vector<std::string>& args, int status, const std::string& mentions) {
    const std::set<std::string> before = ListTree(m_work);
    const RunResult r = Run(args);
    SCOPED_TRACE(testing::PrintToString(args));
    EXPECT_EQ(r.status, status) << r.err;
    EXPECT_EQ(r.err.rfind("vora: ", 0), 0u) << r.err;
    EXPECT_EQ(std::count(r.err.begin(), r.err.end(), '\n'), 1) << r.err;
    EXPECT_NE(r.err.find(mentions), std::string::npos) << r.err;
    EXPECT_EQ(ListTree(m_work), before);
}

std::string EmbeddedProfile(const std::string& path) {
    const auto image = Exiv2::ImageFactory::open(path);
    image->readMetadata();
    if (image->iccProfileDefined())
        return std::string(reinterpret_cast<const char*>(image->iccProfile()->pData_), image->iccProfile()->size_);
    const auto tag = image->exifData().findKey(Exiv2::ExifKey("Exif.Image.InterColorProfile"));
    if (tag == image->exifData().end()) return {};
    std::string bytes(tag->size(), '\0');
    tag->copy(reinterpret_cast<Exiv2::byte*>(bytes.data()), Exiv2::invalidByteOrder);
    return bytes;
}

std::string ProfileDescription(const std::string& iccBytes) {
    cmsHPROFILE profile = cmsOpenProfileFromMem(iccBytes.data(), static_cast<cmsUInt32Number>(iccBytes.size()));
    if (profile == nullptr) return "(unreadable)";
    char text[256] = {0};
    cmsGetProfileInfoASCII(profile, cmsInfoDescription, "en", "US", text, sizeof text);
    cmsCloseProfile(profile);
    return text;
}

bool SameBytes(const cv::Mat& a, const cv::Mat& b) {
    return a.size() == b.size() && a.type() == b.type() && cv::norm(a, b, cv::NORM_INF) == 0.0;
}

cv::Mat ApplyDirect(const vora_api& api, const cv::Mat& pixels, const TRANSFER& t) {
    cv::Mat out = pixels.clone();
    ImageHandle image(out);
    EXPECT_EQ(api.apply_transfer(image.get(), t, image.get()), STATUS_OK);
    return out;
}

cv::Mat Mixed(const cv::Mat& original, const cv::Mat& restyled, double strength) {
    cv::Mat out = restyled.clone();
    for (size_t i = 0; i < out.total() * out.channels(); ++i) {
        const double o = original.data[i], r = restyled.data[i];
        out.data[i] = static_cast<uint8_t>(std::floor(o + strength * (r - o) + 0.5));
    }
    return out;
}

}  // namespace clitest
}  // namespace vora
