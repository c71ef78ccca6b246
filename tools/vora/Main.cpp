// vora: command-line host of the restyling library. Each subcommand lives in
// its own file and registers itself; this file only dispatches and turns
// every error into one line and an exit status.

#include <vora/vora.h>

#include <algorithm>
#include <exception>
#include <iostream>
#include <new>
#include <string>
#include <vector>

#include <opencv2/core.hpp>

#include "vora/Cli.h"

namespace {

using vora::cli::Command;
using vora::cli::CommandRegistry;

void PrintOverview(std::ostream& out) {
    std::vector<Command> commands = CommandRegistry();
    std::sort(commands.begin(), commands.end(),
              [](const Command& a, const Command& b) { return a.name < b.name; });
    out << "usage: vora COMMAND [ARGUMENTS]\n\n"
           "Automatic colour restyling of photographs.\n\ncommands:\n";
    for (const Command& command : commands) {
        std::string name = command.name;
        name.resize(std::max<size_t>(name.size() + 2, 14), ' ');
        out << "  " << name << command.summary << "\n";
    }
    out << "\n'vora COMMAND --help' describes a command. Exit status: 0 done, 1 failure, 2 usage error.\n";
}

}  // namespace

int main(int argc, char** argv) {
    // OpenCV would otherwise print its own multi-line report before we turn the
    // exception into one line.
    cv::redirectError([](int, const char*, const char*, const char*, int, void*) { return 0; });

    std::vector<std::string> args(argv + 1, argv + argc);
    if (args.empty()) {
        vora::cli::PrintError("no command given (see vora --help)");
        return vora::cli::kExitUsage;
    }
    const std::string name = args.front();
    if (name == "--help" || name == "-h" || name == "help") {
        PrintOverview(std::cout);
        return vora::cli::kExitOk;
    }
    if (name == "--version") {
        std::cout << "vora " << VORA_VERSION_STRING << "\n";
        return vora::cli::kExitOk;
    }
    const auto& commands = CommandRegistry();
    auto it = std::find_if(commands.begin(), commands.end(), [&](const Command& c) { return c.name == name; });
    if (it == commands.end()) {
        vora::cli::PrintError("unknown command '" + name + "' (see vora --help)");
        return vora::cli::kExitUsage;
    }
    args.erase(args.begin());
    if (std::find(args.begin(), args.end(), "--help") != args.end() ||
        std::find(args.begin(), args.end(), "-h") != args.end()) {
        std::cout << it->help;
        return vora::cli::kExitOk;
    }
    try {
        return it->run(args);
    } catch (const vora::cli::CliError& error) {
        vora::cli::PrintError(error.what());
        return error.status();
    } catch (const cv::Exception& error) {
        vora::cli::PrintError(name + ": image library error: " + error.err);
        return vora::cli::kExitFailure;
    } catch (const std::bad_alloc&) {
        vora::cli::PrintError(name + ": out of memory");
        return vora::cli::kExitFailure;
    } catch (const std::exception& error) {
        vora::cli::PrintError(name + ": " + error.what());
        return vora::cli::kExitFailure;
    }
}
