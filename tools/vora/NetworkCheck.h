#pragma once

// The last step of examining a model: its network, run through the library.

#include <string>

namespace vora {
namespace cli {

struct ModelExamination;

// Completes an examination of the model's files (ModelFiles.h) with the
// network: constructs a facade on the directory, as any host would, and runs
// one compute on a small synthetic picture. Adds what fails to the problems;
// returns a line for a report.
std::string CheckModelNetwork(ModelExamination& model);

}  // namespace cli
}  // namespace vora
