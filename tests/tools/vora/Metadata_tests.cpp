// The metadata photos carry, through the tool: written into the photo and
// read back from the outputs with exiv2.

#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <opencv2/core.hpp>
#include <opencv2/imgcodecs.hpp>

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"
#include <exiv2/exiv2.hpp>
#pragma GCC diagnostic pop

#include "tools/vora/CliSupport.h"

#pragma GCC diagnostic ignored "-Wdeprecated-declarations"

namespace {

using namespace vora::clitest;

Exiv2::Image::AutoPtr OpenMetadata(const std::string& path) {
    Exiv2::Image::AutoPtr image = Exiv2::ImageFactory::open(path);
    image->readMetadata();
    return image;
}

TEST_F(CliTest, MetadataIsCopiedUprightWithoutThumbnailUnlessStripped) {
    ASSERT_TRUE(WriteTransfers());
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
