// A scenario the lab cannot use: which file, where in it, and what is wrong.
#pragma once

#include <stdexcept>
#include <string>

namespace lab {

class ScenarioError : public std::runtime_error {
public:
    // where: a JSON pointer such as "/devices/1/productId", or "line 3, column 7".
    ScenarioError(std::string file, std::string where, const std::string& what)
        : std::runtime_error(file + ": " + (where.empty() ? std::string("(whole file)") : where) + ": " + what),
          file_(std::move(file)), where_(std::move(where)), problem_(what)
    {
    }

    const std::string& file() const { return file_; }
    const std::string& where() const { return where_; }
    const std::string& problem() const { return problem_; }

private:
    std::string file_;
    std::string where_;
    std::string problem_;
};

// A command that cannot do what it was asked, with the exit code that says
// so; the command line reports it as text or, with --json, as JSON.
class CommandError : public std::runtime_error {
public:
    CommandError(int exitCode, const std::string& what) : std::runtime_error(what), exitCode_(exitCode) {}
    int exitCode() const { return exitCode_; }

private:
    int exitCode_;
};

// Something went wrong in the lab itself, not in the scenario: the module
// cannot be loaded, a temporary folder cannot be made.
class LabError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

}  // namespace lab
