#include "vora/ColourProfiles.h"

#include <memory>

#include <lcms2.h>
#include <opencv2/core/utility.hpp>

#include "vora/Cli.h"

namespace vora {
namespace cli {
namespace {

struct ProfileCloser {
    void operator()(void* profile) const { cmsCloseProfile(profile); }
};
using Profile = std::unique_ptr<void, ProfileCloser>;

struct TransformDeleter {
    void operator()(void* transform) const { cmsDeleteTransform(transform); }
};
using Transform = std::unique_ptr<void, TransformDeleter>;

Profile OpenProfile(const std::string& bytes) {
    return Profile(cmsOpenProfileFromMem(bytes.data(), static_cast<cmsUInt32Number>(bytes.size())));
}

// Grey values in the first byte of each pixel, the other channels ignored.
cmsUInt32Number GreyFormat(int channels) {
    return COLORSPACE_SH(PT_GRAY) | CHANNELS_SH(1) | BYTES_SH(1) | EXTRA_SH(channels - 1);
}

// No cache: the transform is then safe to run from several threads at once.
Transform MakeTransform(void* from, cmsUInt32Number fromFormat, void* to, cmsUInt32Number toFormat) {
    return Transform(cmsCreateTransform(from, fromFormat, to, toFormat, INTENT_PERCEPTUAL, cmsFLAGS_NOCACHE));
}

void RunTransform(void* transform, const cv::Mat& in, cv::Mat& out) {
    cv::parallel_for_(cv::Range(0, in.rows), [&](const cv::Range& rows) {
        cmsDoTransformLineStride(transform, in.ptr(rows.start), out.ptr(rows.start),
                                 static_cast<cmsUInt32Number>(in.cols),
                                 static_cast<cmsUInt32Number>(rows.end - rows.start),
                                 static_cast<cmsUInt32Number>(in.step), static_cast<cmsUInt32Number>(out.step), 0,
                                 0);
    });
}

// Converts pixels with a transform into RGB(A) of the same layout; alpha is
// put back as it was. With `inPlace` (input and output formats the same size
// per pixel: Little CMS reads each pixel before writing it) no copy is made.
cv::Mat ConvertRgb(cv::Mat& pixels, void* transform, bool inPlace) {
    if (inPlace) {
        RunTransform(transform, pixels, pixels);
        return pixels;
    }
    cv::Mat out(pixels.size(), pixels.type());
    RunTransform(transform, pixels, out);
    if (pixels.channels() == 4) {
        const int alpha[] = {3, 3};
        cv::mixChannels(&pixels, 1, &out, 1, alpha, 1);
    }
    return out;
}

std::string Description(void* profile) {
    char text[256] = {0};
    const cmsUInt32Number n = cmsGetProfileInfoASCII(profile, cmsInfoDescription, "en", "US", text, sizeof text);
    std::string name = n > 0 ? std::string(text) : std::string();
    while (!name.empty() && (name.back() == ' ' || name.back() == '\n')) name.pop_back();
    return name.empty() ? "unnamed profile" : name;
}

}  // namespace

ProfileKind ExamineProfile(ColourProfile& profile, bool grey, std::string* why) {
    const Profile opened = OpenProfile(profile.bytes);
    if (!opened) {
        profile.name = "unnamed profile";
        *why = "its colour profile cannot be read";
        return ProfileKind::Unusable;
    }
    profile.name = Description(opened.get());
    const cmsColorSpaceSignature space = cmsGetColorSpace(opened.get());
    if (space != (grey ? cmsSigGrayData : cmsSigRgbData)) {
        *why = "its colour profile (" + profile.name + ") is not " + (grey ? "a grey" : "an RGB") +
               " profile, which its pixels need";
        return ProfileKind::Unusable;
    }
    const Profile srgb(cmsCreate_sRGBProfile());
    const Transform toSrgb = MakeTransform(opened.get(), grey ? TYPE_GRAY_8 : TYPE_RGB_8, srgb.get(), TYPE_RGB_8);
    if (!toSrgb) {
        *why = "its colour profile (" + profile.name + ") cannot convert colours to sRGB";
        return ProfileKind::Unusable;
    }

    // A profile that moves no sampled colour by more than a level is sRGB
    // under another description or encoding (cameras embed many such); its
    // conversion would only add rounding noise.
    const int step = grey ? 1 : 17;
    cv::Mat samples(1, grey ? 256 : 16 * 16 * 16, grey ? CV_8UC1 : CV_8UC3);
    int i = 0;
    for (int r = 0; r < 256; r += step)
        for (int g = 0; g < (grey ? 1 : 256); g += step)
            for (int b = 0; b < (grey ? 1 : 256); b += step, ++i) {
                if (grey)
                    samples.at<uchar>(0, i) = static_cast<uchar>(r);
                else
                    samples.at<cv::Vec3b>(0, i) = cv::Vec3b(static_cast<uchar>(r), static_cast<uchar>(g),
                                                            static_cast<uchar>(b));
            }
    cv::Mat converted(1, samples.cols, CV_8UC3);
    cmsDoTransform(toSrgb.get(), samples.data, converted.data, static_cast<cmsUInt32Number>(samples.cols));
    cv::Mat expected = samples;
    if (grey) cv::merge(std::vector<cv::Mat>{samples, samples, samples}, expected);
    return cv::norm(converted, expected, cv::NORM_INF) <= 1 ? ProfileKind::Srgb : ProfileKind::Convertible;
}

void ConvertToSrgb(cv::Mat& pixels, const ColourProfile& profile, bool grey) {
    const Profile opened = OpenProfile(profile.bytes);
    const Profile srgb(cmsCreate_sRGBProfile());
    const cmsUInt32Number rgb = pixels.channels() == 4 ? TYPE_RGBA_8 : TYPE_RGB_8;
    const Transform transform = MakeTransform(opened.get(), grey ? GreyFormat(pixels.channels()) : rgb, srgb.get(), rgb);
    if (!transform) throw Failure(profile.name + ": cannot convert colours to sRGB");
    // Grey input reads one byte of each pixel and writes three: not in place.
    pixels = ConvertRgb(pixels, transform.get(), !grey);
}

void ConvertFromSrgb(cv::Mat& pixels, const ColourProfile& profile) {
    const Profile opened = OpenProfile(profile.bytes);
    const Profile srgb(cmsCreate_sRGBProfile());
    const cmsUInt32Number format = pixels.channels() == 4 ? TYPE_RGBA_8 : TYPE_RGB_8;
    const Transform transform = MakeTransform(srgb.get(), format, opened.get(), format);
    if (!transform) throw Failure(profile.name + ": cannot convert colours from sRGB into it");
    pixels = ConvertRgb(pixels, transform.get(), true);
}

const std::string& SrgbProfileBytes() {
    static const std::string bytes = [] {
        const Profile srgb(cmsCreate_sRGBProfile());
        cmsUInt32Number size = 0;
        cmsSaveProfileToMem(srgb.get(), nullptr, &size);
        std::string data(size, '\0');
        cmsSaveProfileToMem(srgb.get(), data.data(), &size);
        // Little CMS stamps the profile with the time it was made; a fixed date
        // (2026-01-01, header bytes 24 to 35) keeps outputs reproducible.
        static const char kDate[12] = {0x07, static_cast<char>(0xea), 0, 1, 0, 1, 0, 0, 0, 0, 0, 0};
        if (data.size() >= 36) data.replace(24, 12, kDate, 12);
        return data;
    }();
    return bytes;
}

}  // namespace cli
}  // namespace vora
