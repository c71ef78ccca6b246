#pragma once

// Colour management. The library's arithmetic assumes sRGB, so a photo tagged
// with another ICC profile (Adobe RGB, Display P3, a camera's own) is
// converted into sRGB as it is read, and outputs say they are sRGB, or are
// converted back into the input's profile on request. Little CMS does the
// work; the intent is perceptual (matrix-shaper profiles, the usual kind,
// fall back to relative colorimetric, as ICC defines).

#include <string>

#include <opencv2/core.hpp>

namespace vora {
namespace cli {

// An embedded profile as found in a file.
struct ColourProfile {
    std::string bytes;  // the ICC data; empty when the file had none
    std::string name;   // its description, or "unnamed profile"
};

// What a profile is, as far as conversion goes.
enum class ProfileKind {
    Srgb,         // moves no colour by more than a level (sRGB under another name)
    Convertible,  // an RGB or grey profile other than sRGB
    Unusable,     // damaged, or of a colour space vora does not convert (CMYK, Lab)
};

// Reads the profile's description and decides its kind. `grey` says that the
// file's pixels were stored as grey (its profile must then be a grey one).
// Never throws; `why` explains Unusable.
ProfileKind ExamineProfile(ColourProfile& profile, bool grey, std::string* why);

// Converts 8-bit RGB or RGBA pixels (alpha untouched) from a Convertible
// profile into sRGB. For a grey profile the pixels hold the grey value in all
// three colour channels.
void ConvertToSrgb(cv::Mat& pixels, const ColourProfile& profile, bool grey);

// The reverse, for outputs written in the input's profile (RGB profiles only;
// a grey profile's output stays sRGB).
void ConvertFromSrgb(cv::Mat& pixels, const ColourProfile& profile);

// The sRGB profile that outputs carry (Little CMS's own, serialised once).
const std::string& SrgbProfileBytes();

}  // namespace cli
}  // namespace vora
