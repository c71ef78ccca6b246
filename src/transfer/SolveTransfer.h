#pragma once

#include <vector>

#include <vora/vora.h>

#include "transfer/ColourStatistics.h"

namespace vora {

// Fills contentMean, styleMean, chromaMatrix, toneCurve, lightnessLow and
// lightnessHigh of the record from the two statistics. Returns 0.
int SolveTransfer(const ColourStats& content, const ColourStats& style, TRANSFER& transfer,
                  const VoraParameters& params);

// Fits the arctan tone curve (coarse then fine grid, float32 throughout) and
// writes toneCurve. Returns 0.
int FitToneCurve(const ColourStats& content, const ColourStats& style, TRANSFER& transfer,
                 const VoraParameters& params);

// Pieces of the tone fit, exposed for tests.

// The fit's 32 targets: the style samples, or, when some sample moves by more
// than limitFactor x 0.2, the content moved toward the style so that the
// largest move is exactly 0.2.
void ToneTargets(const ColourStats& content, const ColourStats& style, const VoraParameters& params,
                 float targets[32]);

struct ToneGridPoint {
    float centre;  // a
    float width;   // w
};

// The points the coarse search tries, in order (the same loops the fit runs).
std::vector<ToneGridPoint> ToneCoarseGrid();

}  // namespace vora
