// Photos tagged with other colour profiles, and the metadata photos carry,
// through the tool: the profile is converted with Little CMS's own tools as
// the reference, the metadata is written and read back with exiv2.

#include <cstdlib>
#include <filesystem>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <lcms2.h>
#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"
#include <exiv2/exiv2.hpp>
#pragma GCC diagnostic pop

#include "tools/vora/CliSupport.h"

#pragma GCC diagnostic ignored "-Wdeprecated-declarations"

namespace {

using namespace vora::clitest;

const char* const kAdobeProfile = "/usr/share/color/icc/compatibleWithAdobeRGB1998.icc";

bool HaveTool(const std::string& name) { return std::system(("command -v " + name + " >/dev/null").c_str()) == 0; }

Exiv2::Image::AutoPtr OpenMetadata(const std::string& path) {
    Exiv2::Image::AutoPtr image = Exiv2::ImageFactory::open(path);
    image->readMetadata();
    return image;
}

std::string EmbeddedProfile(const std::string& path) {
    Exiv2::Image::AutoPtr image = OpenMetadata(path);
    if (image->iccProfileDefined())
        return std::string(reinterpret_cast<const char*>(image->iccProfile()->pData_), image->iccProfile()->size_);
    const auto tag = image->exifData().findKey(Exiv2::ExifKey("Exif.Image.InterColorProfile"));
    if (tag == image->exifData().end()) return {};
    std::string bytes(tag->size(), '\0');
    tag->copy(reinterpret_cast<Exiv2::byte*>(bytes.data()), Exiv2::invalidByteOrder);
    return bytes;
}

std::string ProfileDescription(const std::string& bytes) {
    cmsHPROFILE profile = cmsOpenProfileFromMem(bytes.data(), static_cast<cmsUInt32Number>(bytes.size()));
    if (profile == nullptr) return "(unreadable)";
    char text[256] = {0};
    cmsGetProfileInfoASCII(profile, cmsInfoDescription, "en", "US", text, sizeof text);
    cmsCloseProfile(profile);
    return text;
}

class ColourAndMetadata : public CliTest {
protected:
    void SetUp() override {
        CliTest::SetUp();
        ASSERT_TRUE(WriteTransfers());
    }
    // Runs a shell command in the work folder.
    int Shell(const std::string& command) { return std::system(("cd '" + m_work + "' && " + command).c_str()); }
};

TEST_F(ColourAndMetadata, TaggedPhotoRestylesAsItsSrgbConversionAndCanKeepItsProfile) {
    if (!HaveTool("tificc") || !std::filesystem::exists(kAdobeProfile))
        GTEST_SKIP() << "needs tificc (liblcms2-utils) and " << kAdobeProfile << " (icc-profiles-free)";
    WriteRgb(m_work + "/orig.tif", m_photo);
    // The photo in Adobe RGB, tagged; and that file's own conversion to sRGB.
    ASSERT_EQ(Shell(std::string("tificc -e -o") + kAdobeProfile + " orig.tif adobe.tif && tificc adobe.tif back.tif"),
              0);

    const RunResult tagged = Run({"apply", "adobe.tif", "t.json", "a.png", "--model", m_modelDir});
    ASSERT_EQ(tagged.status, 0) << tagged.err;
    EXPECT_EQ(tagged.err, "vora: adobe.tif: converted from Compatible with Adobe RGB (1998) to sRGB\n");
    const RunResult converted = Run({"apply", "back.tif", "t.json", "b.png", "--model", m_modelDir});
    ASSERT_EQ(converted.status, 0) << converted.err;
    EXPECT_EQ(converted.err, "");
    EXPECT_LE(cv::norm(ReadRgb(m_work + "/a.png"), ReadRgb(m_work + "/b.png"), cv::NORM_INF), 1.0);
    // The tagged photo differs from sRGB: read as sRGB, it would restyle otherwise.
    EXPECT_GT(cv::norm(ReadRgb(m_work + "/adobe.tif"), ReadRgb(m_work + "/back.tif"), cv::NORM_INF), 10.0);
    EXPECT_EQ(ProfileDescription(EmbeddedProfile(m_work + "/a.png")), "sRGB built-in");

    // --keep-profile: written in the input's profile and tagged with it.
    for (const std::string name : {"k.tif", "k.jpg", "k.png", "k.webp"}) {
        SCOPED_TRACE(name);
        ASSERT_EQ(Run({"apply", "adobe.tif", "t.json", name, "--model", m_modelDir, "--keep-profile"}).status, 0);
        EXPECT_EQ(EmbeddedProfile(m_work + "/" + name), ReadBytes(kAdobeProfile));
    }
    ASSERT_EQ(Shell("tificc k.tif k-srgb.tif"), 0);
    EXPECT_LE(cv::norm(ReadRgb(m_work + "/k-srgb.tif"), ReadRgb(m_work + "/a.png"), cv::NORM_INF), 2.0);
}

TEST_F(ColourAndMetadata, MetadataIsCopiedUprightWithoutThumbnailUnlessStripped) {
    // A photo stored on its side (orientation 6: turn 90 degrees clockwise to view).
    cv::Mat stored;
    cv::rotate(m_photo, stored, cv::ROTATE_90_COUNTERCLOCKWISE);
    WriteRgb(m_work + "/side.jpg", stored);
    {
        Exiv2::Image::AutoPtr image = OpenMetadata(m_work + "/side.jpg");
        Exiv2::ExifData exif;
        exif["Exif.Image.Orientation"] = static_cast<uint16_t>(6);
        exif["Exif.Image.Copyright"] = "(c) 2026 A. Photographer";
        exif["Exif.GPSInfo.GPSLatitudeRef"] = "N";
        exif["Exif.GPSInfo.GPSLatitude"] = "52/1 31/1 1234/100";
        std::vector<uchar> thumbnail;
        cv::imencode(".jpg", cv::Mat(16, 16, CV_8UC3, cv::Scalar(0, 0, 255)), thumbnail);
        Exiv2::ExifThumb(exif).setJpegThumbnail(thumbnail.data(), static_cast<long>(thumbnail.size()));
        image->setExifData(exif);
        Exiv2::XmpData xmp;
        xmp["Xmp.dc.rights"] = "All rights reserved";
        image->setXmpData(xmp);
        Exiv2::IptcData iptc;
        iptc["Iptc.Application2.Copyright"] = "A. Photographer";
        image->setIptcData(iptc);
        image->writeMetadata();
    }

    for (const std::string name : {"o.jpg", "o.png", "o.tif", "o.webp"}) {
        SCOPED_TRACE(name);
        ASSERT_EQ(Run({"apply", "side.jpg", "t.json", name, "--model", m_modelDir}).status, 0);
        EXPECT_EQ(ReadRgb(m_work + "/" + name).size(), m_photo.size());  // turned upright
        Exiv2::Image::AutoPtr out = OpenMetadata(m_work + "/" + name);
        const Exiv2::ExifData& exif = out->exifData();
        ASSERT_NE(exif.findKey(Exiv2::ExifKey("Exif.Image.Copyright")), exif.end());
        EXPECT_EQ(exif.findKey(Exiv2::ExifKey("Exif.Image.Copyright"))->toString(), "(c) 2026 A. Photographer");
        EXPECT_EQ(exif.findKey(Exiv2::ExifKey("Exif.Image.Orientation"))->toLong(), 1);
        EXPECT_EQ(exif.findKey(Exiv2::ExifKey("Exif.GPSInfo.GPSLatitude"))->toString(), "52/1 31/1 1234/100");
        EXPECT_EQ(exif.findKey(Exiv2::ExifKey("Exif.Image.Software"))->toString(), "vora " VORA_VERSION_STRING);
        EXPECT_EQ(Exiv2::ExifThumbC(exif).copy().size_, 0);
        EXPECT_EQ(out->xmpData().findKey(Exiv2::XmpKey("Xmp.dc.rights"))->toString(), "lang=\"x-default\" All rights reserved");
        if (name != "o.webp") {  // WebP has no place for IPTC
            EXPECT_NE(out->iptcData().findKey(Exiv2::IptcKey("Iptc.Application2.Copyright")), out->iptcData().end());
        }
        EXPECT_EQ(ProfileDescription(EmbeddedProfile(m_work + "/" + name)), "sRGB built-in");
    }

    ASSERT_EQ(Run({"apply", "side.jpg", "t.json", "s.jpg", "--model", m_modelDir, "--strip-metadata"}).status, 0);
    Exiv2::Image::AutoPtr stripped = OpenMetadata(m_work + "/s.jpg");
    EXPECT_TRUE(stripped->exifData().empty());
    EXPECT_TRUE(stripped->xmpData().empty());
    EXPECT_TRUE(stripped->iptcData().empty());
    EXPECT_EQ(ProfileDescription(EmbeddedProfile(m_work + "/s.jpg")), "sRGB built-in");
}

}  // namespace
