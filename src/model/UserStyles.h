#pragma once

#include <vora/vora.h>

namespace vora {

// Placeholder behind vora_api::add_style: imports the image as a compute would
// (so an unusable image fails the same way), stores nothing. Returns 0.
int AddUserStyle(const IImage* style);

}  // namespace vora
