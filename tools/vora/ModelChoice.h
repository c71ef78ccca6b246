#pragma once

// Which model a command uses, and opening it through the library.

#include <memory>
#include <string>

#include <vora/vora.h>

namespace vora {
namespace cli {

// --model, else $VORA_MODEL, else ./model.
std::string ChooseModelDir(const std::string& given);

// For rendering a saved transfer: --model, else the model the transfers file
// records (when that folder still exists), else as ChooseModelDir.
std::string ChooseModelDirForRecord(const std::string& given, const std::string& recorded);

// The library joins the network folder to the directory without a separator
// (DIR + "net/"), so the tool always hands it a directory ending in '/'.
std::string WithTrailingSlash(const std::string& dir);

// The directory as an absolute, normalised path without a trailing separator,
// as recorded in transfers files.
std::string AbsoluteModelPath(const std::string& dir);

// Failure unless dir is an existing folder.
void RequireModelDirectory(const std::string& dir);

// Constructs the facade on dir. Failure when the folder is missing or the
// network does not load (the library reports that by the network loader's
// exception, which is turned into one line here).
std::unique_ptr<vora_api> OpenModel(const std::string& dir);

struct ModelExamination;

// Examines the model's files (ModelFiles.h): Failure naming the first problem
// when they are broken, before the library reads them.
ModelExamination ExamineSoundModel(const std::string& dir);

// OpenModel after examining the model's files (ModelFiles.h): Failure naming
// the first problem when they are broken, before the library reads them.
std::unique_ptr<vora_api> OpenExaminedModel(const std::string& dir);

}  // namespace cli
}  // namespace vora
