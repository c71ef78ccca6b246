#pragma once

// Shared plumbing of the vora tool: the two kinds of error a command can end
// with, the command registry and a small option parser.

#include <functional>
#include <map>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

namespace vora {
namespace cli {

// Exit statuses: 0 done, 1 a failure (unreadable file, broken model, a
// library status other than OK), 2 a usage error (the command line itself is
// wrong, including an index or parameter out of range).
enum ExitStatus { kExitOk = 0, kExitFailure = 1, kExitUsage = 2 };

// Each error carries one line, printed as "vora: <line>". When the subject is
// a file, the line starts with the file's name: "photo.jpg: cannot read image".
class CliError : public std::runtime_error {
public:
    CliError(ExitStatus status, const std::string& line) : std::runtime_error(line), m_status(status) {}
    ExitStatus status() const { return m_status; }

private:
    ExitStatus m_status;
};

struct UsageError : CliError {
    explicit UsageError(const std::string& line) : CliError(kExitUsage, line) {}
};

struct Failure : CliError {
    explicit Failure(const std::string& line) : CliError(kExitFailure, line) {}
    Failure(const std::string& subject, const std::string& what) : CliError(kExitFailure, subject + ": " + what) {}
};

// --- Options -----------------------------------------------------------------

struct OptionSpec {
    std::string name;        // "--model"
    std::string shortName;   // "-n", or empty
    bool takesValue = true;
    bool repeatable = false;
};

inline OptionSpec ValueOption(const std::string& name, const std::string& shortName = std::string()) {
    return OptionSpec{name, shortName, true, false};
}
inline OptionSpec RepeatedOption(const std::string& name) { return OptionSpec{name, std::string(), true, true}; }
inline OptionSpec FlagOption(const std::string& name) { return OptionSpec{name, std::string(), false, false}; }

// Parses "--name VALUE", "--name=VALUE", "-n VALUE", flags and positionals
// ("--" ends the options). Unknown options and repeated single options are
// usage errors. "--help" and "-h" are recognised by every command.
class ParsedArgs {
public:
    ParsedArgs(const std::string& command, const std::vector<OptionSpec>& optionSpecs,
               const std::vector<std::string>& args);

    bool helpRequested() const { return m_help; }
    bool Flag(const std::string& name) const;
    std::optional<std::string> Value(const std::string& name) const;
    std::vector<std::string> Values(const std::string& name) const;
    const std::vector<std::string>& positionals() const { return m_positionals; }
    // Usage error unless there are between min and max positionals.
    void ExpectPositionals(size_t min, size_t max, const std::string& synopsis) const;

private:
    std::string m_command;
    bool m_help = false;
    std::map<std::string, std::vector<std::string>> m_values;
    std::vector<std::string> m_positionals;
};

// --- Parameter parsing (usage errors name the option) --------------------------

long long ParseInteger(const std::string& text, const std::string& what, long long min, long long max);
double ParseReal(const std::string& text, const std::string& what);
// A finite float factor in [min, max]; minExclusive makes min itself invalid.
float ParseFactor(const std::string& text, const std::string& what, double min, bool minExclusive, double max);

// --- Commands ------------------------------------------------------------------

struct Command {
    std::string name;
    std::string summary;  // one line for "vora --help"
    std::string help;     // full text for "vora NAME --help"
    std::function<int(const std::vector<std::string>&)> run;
};

std::vector<Command>& CommandRegistry();

// Registers a command at static-initialisation time, so each command lives in
// its own file and main knows none of them by name.
struct RegisterCommand {
    explicit RegisterCommand(Command command);
};

// Prints "vora: <line>" on standard error.
void PrintError(const std::string& line);
// Prints "vora: <line>" on standard error, as a remark that does not stop the
// command. Safe from any thread; while standard error is muted, the notice is
// held and printed when it is restored.
void PrintNotice(const std::string& line);

// Sends standard error to /dev/null while it lives, for libraries that print
// their own warnings (the image decoders); our notices are held meanwhile.
// Nests, and may be used by several threads at once: the stream is restored
// when the last one ends.
class MutedStandardError {
public:
    MutedStandardError();
    ~MutedStandardError();
    MutedStandardError(const MutedStandardError&) = delete;
    MutedStandardError& operator=(const MutedStandardError&) = delete;
};

}  // namespace cli
}  // namespace vora
