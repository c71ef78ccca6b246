#pragma once

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

}  // namespace vora
