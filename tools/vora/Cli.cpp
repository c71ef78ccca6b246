#include "vora/Cli.h"

#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cmath>
#include <cstdlib>
#include <iostream>
#include <limits>
#include <mutex>
#include <vector>

#include <fcntl.h>
#include <unistd.h>

namespace vora {
namespace cli {

ParsedArgs::ParsedArgs(const std::string& command, const std::vector<OptionSpec>& optionSpecs,
                       const std::vector<std::string>& args)
    : m_command(command) {
    auto findSpec = [&](const std::string& token) -> const OptionSpec* {
        for (const OptionSpec& optionSpec : optionSpecs)
            if (token == optionSpec.name || (!optionSpec.shortName.empty() && token == optionSpec.shortName)) return &optionSpec;
        return nullptr;
    };

    bool optionsEnded = false;
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string& token = args[i];
        if (optionsEnded || token.size() < 2 || token[0] != '-') {
            // A lone "-" is a positional too (nothing in this tool reads stdin,
            // so it ends up as a file name that does not exist).
            m_positionals.push_back(token);
            continue;
        }
        if (token == "--") {
            optionsEnded = true;
            continue;
        }
        if (token == "--help" || token == "-h") {
            m_help = true;
            continue;
        }
        std::string name = token;
        std::optional<std::string> inlineValue;
        const size_t equals = token.find('=');
        if (token.rfind("--", 0) == 0 && equals != std::string::npos) {
            name = token.substr(0, equals);
            inlineValue = token.substr(equals + 1);
        }
        const OptionSpec* optionSpec = findSpec(name);
        if (!optionSpec) {
            // "-5" style negative numbers are not options anywhere in this tool.
            throw UsageError(m_command + ": unknown option " + name + " (see vora " + m_command + " --help)");
        }
        std::vector<std::string>& slot = m_values[optionSpec->name];
        if (!slot.empty() && !optionSpec->repeatable)
            throw UsageError(m_command + ": option " + optionSpec->name + " given more than once");
        if (!optionSpec->takesValue) {
            if (inlineValue) throw UsageError(m_command + ": option " + optionSpec->name + " takes no value");
            slot.push_back("");
            continue;
        }
        if (inlineValue) {
            slot.push_back(*inlineValue);
        } else {
            if (i + 1 >= args.size()) throw UsageError(m_command + ": option " + optionSpec->name + " needs a value");
            slot.push_back(args[++i]);
        }
    }
}

bool ParsedArgs::Flag(const std::string& name) const { return m_values.count(name) != 0; }

std::optional<std::string> ParsedArgs::Value(const std::string& name) const {
    auto it = m_values.find(name);
    if (it == m_values.end() || it->second.empty()) return std::nullopt;
    return it->second.back();
}

std::vector<std::string> ParsedArgs::Values(const std::string& name) const {
    auto it = m_values.find(name);
    return it == m_values.end() ? std::vector<std::string>{} : it->second;
}

void ParsedArgs::ExpectPositionals(size_t min, size_t max, const std::string& synopsis) const {
    if (m_positionals.size() < min)
        throw UsageError(m_command + ": missing arguments; usage: vora " + synopsis);
    if (m_positionals.size() > max)
        throw UsageError(m_command + ": unexpected argument '" + m_positionals[max] + "'; usage: vora " + synopsis);
}

long long ParseInteger(const std::string& text, const std::string& what, long long min, long long max) {
    const char* begin = text.c_str();
    char* end = nullptr;
    errno = 0;
    const long long value = std::strtoll(begin, &end, 10);
    if (text.empty() || *end != '\0' || errno == ERANGE || std::isspace(static_cast<unsigned char>(text[0])))
        throw UsageError(what + ": '" + text + "' is not a whole number");
    if (value < min || value > max)
        throw UsageError(what + ": " + text + " is out of range (" + std::to_string(min) + " to " +
                         std::to_string(max) + ")");
    return value;
}

double ParseReal(const std::string& text, const std::string& what) {
    const char* begin = text.c_str();
    char* end = nullptr;
    errno = 0;
    const double value = std::strtod(begin, &end);
    if (text.empty() || *end != '\0' || std::isspace(static_cast<unsigned char>(text[0])))
        throw UsageError(what + ": '" + text + "' is not a number");
    if (!std::isfinite(value) || errno == ERANGE) throw UsageError(what + ": '" + text + "' is not a finite number");
    return value;
}

float ParseFactor(const std::string& text, const std::string& what, double min, bool minExclusive, double max) {
    const double value = ParseReal(text, what);
    const bool belowMin = minExclusive ? !(value > min) : !(value >= min);
    if (belowMin || value > max) {
        char range[96];
        std::snprintf(range, sizeof range, "%s %g and at most %g", minExclusive ? "above" : "at least", min, max);
        throw UsageError(what + ": " + text + " is out of range (must be " + range + ")");
    }
    return static_cast<float>(value);
}

std::vector<Command>& CommandRegistry() {
    static std::vector<Command> commands;
    return commands;
}

RegisterCommand::RegisterCommand(Command command) { CommandRegistry().push_back(std::move(command)); }

namespace {

// Messages from dependencies may span lines; ours are one line each.
std::string OneLine(const std::string& text) {
    std::string line;
    for (char c : text) {
        if (c == '\n' || c == '\r' || c == '\t') c = ' ';
        if (c == ' ' && !line.empty() && line.back() == ' ') continue;
        line += c;
    }
    while (!line.empty() && line.back() == ' ') line.pop_back();
    return line;
}

}  // namespace

void PrintError(const std::string& line) { std::cerr << "vora: " << OneLine(line) << std::endl; }

namespace {

std::mutex g_standardError;
int g_muteDepth = 0;
int g_savedStandardError = -1;
std::vector<std::string> g_heldNotices;

}  // namespace

void PrintNotice(const std::string& line) {
    const std::lock_guard<std::mutex> lock(g_standardError);
    if (g_muteDepth > 0)
        g_heldNotices.push_back(OneLine(line));
    else
        std::cerr << "vora: " << OneLine(line) << std::endl;
}

MutedStandardError::MutedStandardError() {
    const std::lock_guard<std::mutex> lock(g_standardError);
    if (g_muteDepth++ > 0) return;
    std::cerr.flush();
    std::fflush(stderr);
    g_savedStandardError = dup(STDERR_FILENO);
    const int null = open("/dev/null", O_WRONLY);
    if (g_savedStandardError >= 0 && null >= 0) dup2(null, STDERR_FILENO);
    if (null >= 0) close(null);
}

MutedStandardError::~MutedStandardError() {
    const std::lock_guard<std::mutex> lock(g_standardError);
    if (--g_muteDepth > 0) return;
    std::fflush(stderr);
    if (g_savedStandardError >= 0) {
        dup2(g_savedStandardError, STDERR_FILENO);
        close(g_savedStandardError);
        g_savedStandardError = -1;
    }
    for (const std::string& notice : g_heldNotices) std::cerr << "vora: " << notice << std::endl;
    g_heldNotices.clear();
}

}  // namespace cli
}  // namespace vora
