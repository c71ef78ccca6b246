// How far proposals turn the colour of a face: the median a*, b* of the
// face box in the original and in each proposal, the hue angle of those
// medians, and how many proposals turn it by more than a limit. Medians
// rather than means, so eyes, teeth and hair at the box's edge do not count.

#include <cmath>
#include <cstdio>
#include <string>
#include <vector>

#include "modelkit/SkinHue.h"

int main(int argc, char** argv) {
    using namespace vora::modelkit;
    if (argc < 4) {
        std::fprintf(stderr,
                     "usage: vora-skin-hue L,R,T,B ORIGINAL PROPOSAL... [--limit DEGREES]\n"
                     "  L,R,T,B   the face box as 'vora faces' prints it (normalised, y downward)\n"
                     "  --limit   hue turn counted as a change of skin colour (default 20)\n");
        return 2;
    }
    double limit = 20.0;
    std::vector<std::string> images;
    for (int i = 2; i < argc; ++i) {
        const std::string arg = argv[i];
        if (arg == "--limit" && i + 1 < argc) {
            limit = std::atof(argv[++i]);
        } else {
            images.push_back(arg);
        }
    }
    vora::CFaceRect box(0, 0, 0, 0);
    if (!ParseFaceRect(argv[1], box)) {
        std::fprintf(stderr, "vora-skin-hue: '%s' is not a face box L,R,T,B with 0 <= L < R <= 1, 0 <= T < B <= 1\n", argv[1]);
        return 2;
    }
    std::vector<SkinColour> colours;
    for (const std::string& path : images) {
        SkinColour colour;
        if (!MeasureSkin(path, box, colour)) {
            std::fprintf(stderr, "vora-skin-hue: cannot read %s\n", path.c_str());
            return 1;
        }
        colours.push_back(colour);
    }
    std::printf("%-40s %7s %7s %7s %7s\n", "image", "a*", "b*", "hue", "turn");
    int turned = 0;
    for (size_t i = 0; i < colours.size(); ++i) {
        const double turn = i == 0 ? 0.0 : HueTurn(colours[0], colours[i]);
        if (std::fabs(turn) > limit) ++turned;
        std::printf("%-40s %7.2f %7.2f %7.1f %7.1f\n", images[i].c_str(), colours[i].a, colours[i].b,
                    colours[i].HueDegrees(), turn);
    }
    std::printf("%d of %zu proposals turn the skin hue by more than %.0f degrees\n", turned, colours.size() - 1, limit);
    return 0;
}
