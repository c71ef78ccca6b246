#include "vora/ModelChoice.h"

#include <cstdlib>
#include <filesystem>
#include <new>

#include <opencv2/core.hpp>

#include "vora/Cli.h"
#include "vora/ModelFiles.h"

namespace vora {
namespace cli {

std::string ChooseModelDir(const std::string& given) {
    if (!given.empty()) return given;
    if (const char* env = std::getenv("VORA_MODEL"); env && *env) return env;
    return "./model";
}

std::string ChooseModelDirForRecord(const std::string& given, const std::string& recorded) {
    std::error_code ec;
    if (given.empty() && !recorded.empty() && std::filesystem::is_directory(recorded, ec)) return recorded;
    return ChooseModelDir(given);
}

std::string WithTrailingSlash(const std::string& dir) {
    if (dir.empty()) return "./";
    return dir.back() == '/' ? dir : dir + "/";
}

std::string AbsoluteModelPath(const std::string& dir) {
    std::error_code ec;
    std::string path = std::filesystem::absolute(dir, ec).lexically_normal().string();
    while (path.size() > 1 && path.back() == '/') path.pop_back();
    return path;
}

void RequireModelDirectory(const std::string& dir) {
    std::error_code ec;
    if (!std::filesystem::exists(dir, ec)) throw Failure(dir, "no such model directory");
    if (!std::filesystem::is_directory(dir, ec)) throw Failure(dir, "is not a directory (a model is a folder)");
}

std::unique_ptr<vora_api> OpenModel(const std::string& dir) {
    RequireModelDirectory(dir);
    try {
        return std::make_unique<vora_api>(WithTrailingSlash(dir));
    } catch (const cv::Exception& e) {
        throw Failure(dir, "the model's network does not load (" + e.err + "); run 'vora inspect " + dir + "'");
    } catch (const std::bad_alloc&) {
        throw;
    } catch (const std::exception& e) {
        throw Failure(dir, std::string("the model's network does not load (") + e.what() + "); run 'vora inspect " +
                               dir + "'");
    }
}

ModelExamination ExamineSoundModel(const std::string& dir) {
    RequireModelDirectory(dir);
    ModelExamination model = ExamineModelFiles(dir);
    if (model.broken())
        throw Failure(dir, "the model is broken: " + model.problems.front() + " (run 'vora inspect " + dir +
                               "' for the full report)");
    return model;
}

std::unique_ptr<vora_api> OpenExaminedModel(const std::string& dir) {
    (void)ExamineSoundModel(dir);
    return OpenModel(dir);
}

}  // namespace cli
}  // namespace vora
