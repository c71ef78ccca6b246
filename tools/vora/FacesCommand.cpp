// vora faces: the faces --faces auto would pass, in the form --faces reads.

#include <iostream>

#include "vora/Cli.h"
#include "vora/FaceDetection.h"
#include "vora/Images.h"

namespace vora {
namespace cli {
namespace {

const char* const kHelp =
    "usage: vora faces PHOTO [--detector hog|haar]\n"
    "\n"
    "Prints the faces found in PHOTO, one per line as L,R,T,B (normalised 0..1,\n"
    "y downward) followed by the detector's score. Each line can be given to\n"
    "'vora suggest --faces' as it stands, after any correction by hand.\n"
    "\n"
    "  --detector hog|haar  hog: dlib's HOG frontal-face detector (the default of\n"
    "                       --faces auto); haar: OpenCV's alt2 Haar cascade\n"
    "  --max-pixels N       refuse photos above N pixels before decoding them\n"
    "                       (default 128000000)\n";

int Run(const std::vector<std::string>& args) {
    ParsedArgs parsed("faces", {ValueOption("--detector"), ValueOption("--max-pixels")}, args);
    parsed.ExpectPositionals(1, 1, "faces PHOTO [--detector hog|haar]");
    FaceDetector detector = DefaultFaceDetector();
    if (auto name = parsed.Value("--detector")) detector = ParseFaceDetector(*name);
    const Photo photo = ReadPhotoRgb(parsed.positionals()[0], MaxPixelsOption(parsed.Value("--max-pixels")));
    const std::vector<DetectedFace> faces = DetectFaces(PackedRgb(photo), detector);
    for (const DetectedFace& face : faces) std::cout << FormatFaceRect(face.box) << "  " << face.score << "\n";
    std::cerr << faces.size() << (faces.size() == 1 ? " face" : " faces") << " found by "
              << FaceDetectorName(detector) << "\n";
    return kExitOk;
}

const RegisterCommand kRegistration({"faces", "find faces in a photo (as --faces would take them)", kHelp, Run});

}  // namespace
}  // namespace cli
}  // namespace vora
