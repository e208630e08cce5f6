#include "wineProcess.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>

#include <fmt/format.h>

#include "scenarioError.h"

namespace lab {

namespace {

std::filesystem::path fromEnvironment(const char* name, const char* built)
{
    const char* value = std::getenv(name);
    if (value != nullptr && *value != 0) return value;
    return built;
}

#ifndef MORVANEK_WINE64
#define MORVANEK_WINE64 ""
#endif
#ifndef MORVANEK_WINE_HOST
#define MORVANEK_WINE_HOST ""
#endif
#ifndef MORVANEK_DRIVER_IMAGE
#define MORVANEK_DRIVER_IMAGE ""
#endif
#ifndef MORVANEK_WINE_PREFIX
#define MORVANEK_WINE_PREFIX ""
#endif

}  // namespace

WineSetup WineSetup::find()
{
    WineSetup setup;
    setup.wine64 = fromEnvironment("MORVANEK_WINE64", MORVANEK_WINE64);
    setup.hostProgram = fromEnvironment("MORVANEK_WINE_HOST", MORVANEK_WINE_HOST);
    setup.image = fromEnvironment("MORVANEK_DRIVER_IMAGE", MORVANEK_DRIVER_IMAGE);
    setup.prefix = fromEnvironment("MORVANEK_WINE_PREFIX", MORVANEK_WINE_PREFIX);
    auto require = [](const std::filesystem::path& path, const char* what) {
        std::error_code error;
        if (path.empty() || !std::filesystem::exists(path, error))
            throw LabError(fmt::format("the Windows engine needs {} ({}), which is not there; build the driver with "
                                       "wine64 and mingw-w64 installed (scripts/install-deps all)",
                                       what, path.empty() ? "not configured" : path.string()));
    };
    require(setup.wine64, "wine64");
    require(setup.hostProgram, "the Windows-side host morvanek-wine-host.exe");
    require(setup.image, "morvanek.sys");
    if (setup.prefix.empty()) throw LabError("the Windows engine has no Wine prefix configured");
    return setup;
}

std::wstring windowsPathOf(const std::filesystem::path& path)
{
    std::string text = std::filesystem::absolute(path).lexically_normal().string();
    std::wstring out = L"Z:";
    for (char c : text) out += c == '/' ? L'\\' : static_cast<wchar_t>(static_cast<unsigned char>(c));
    return out;
}

WineProcess::WineProcess(const WineSetup& setup)
{
    std::error_code error;
    std::filesystem::create_directories(setup.prefix, error);
    // Runs share the prefix's registry and drive: one at a time.
    std::filesystem::path lock = setup.prefix.parent_path() / (setup.prefix.filename().string() + ".lock");
    lockFd_ = ::open(lock.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644);
    if (lockFd_ < 0 || ::flock(lockFd_, LOCK_EX) != 0)
        throw LabError("cannot lock the Wine prefix " + setup.prefix.string() + ": " + std::strerror(errno));

    // A new prefix is made once, before the first run (Wine takes seconds for it).
    if (!std::filesystem::exists(setup.prefix / "drive_c", error)) {
        const std::string prefixVariable = "WINEPREFIX=" + std::filesystem::absolute(setup.prefix).string();
        const std::string wine = setup.wine64.string();
        int initializer = ::fork();
        if (initializer == 0) {
            int quiet = ::open("/dev/null", O_WRONLY);
            ::dup2(quiet, 1);
            ::dup2(quiet, 2);
            ::putenv(const_cast<char*>(prefixVariable.c_str()));
            ::setenv("WINEDEBUG", "-all", 1);
            ::setenv("WINEDLLOVERRIDES", "mscoree,mshtml=", 1);
            ::unsetenv("DISPLAY");
            ::execl(wine.c_str(), wine.c_str(), "wineboot", "--init", static_cast<char*>(nullptr));
            ::_exit(127);
        }
        int status = 0;
        if (initializer < 0 || ::waitpid(initializer, &status, 0) != initializer || !WIFEXITED(status) ||
            WEXITSTATUS(status) != 0)
            throw LabError("cannot make the Wine prefix " + setup.prefix.string());
    }

    char errorTemplate[] = "/tmp/morvanek-wine-host-XXXXXX";
    int errorFd = ::mkstemp(errorTemplate);
    if (errorFd < 0) throw LabError(std::string("cannot make a file for Wine's messages: ") + std::strerror(errno));
    errorFile_ = errorTemplate;

    int in[2];
    int out[2];
    if (::pipe2(in, O_CLOEXEC) != 0 || ::pipe2(out, O_CLOEXEC) != 0)
        throw LabError(std::string("cannot make pipes for Wine: ") + std::strerror(errno));
    // A harness that dies must not take the lab with it.
    ::signal(SIGPIPE, SIG_IGN);

    const std::string wine = setup.wine64.string();
    const std::string host = setup.hostProgram.string();
    const std::wstring imageWide = windowsPathOf(setup.image);
    const std::string image(imageWide.begin(), imageWide.end());
    const std::string prefix = "WINEPREFIX=" + std::filesystem::absolute(setup.prefix).string();
    const std::string folder = setup.hostProgram.parent_path().string();
    pid_ = ::fork();
    if (pid_ < 0) throw LabError(std::string("cannot start wine64: ") + std::strerror(errno));
    if (pid_ == 0) {
        ::dup2(in[0], 0);
        ::dup2(out[1], 1);
        ::dup2(errorFd, 2);
        if (::chdir(folder.c_str()) != 0) ::_exit(126);
        ::putenv(const_cast<char*>(prefix.c_str()));
        ::setenv("WINEDEBUG", "-all", 1);
        ::setenv("WINEDLLOVERRIDES", "mscoree,mshtml=", 1);
        ::unsetenv("DISPLAY");
        ::execl(wine.c_str(), wine.c_str(), host.c_str(), image.c_str(), static_cast<char*>(nullptr));
        ::_exit(127);
    }
    ::close(errorFd);
    ::close(in[0]);
    ::close(out[1]);
    toHost_ = in[1];
    fromHost_ = out[0];
}

WineProcess::~WineProcess()
{
    if (toHost_ >= 0) ::close(toHost_);
    if (fromHost_ >= 0) ::close(fromHost_);
    if (pid_ > 0) {
        int status = 0;
        if (::waitpid(pid_, &status, WNOHANG) == 0) {
            // With its pipes closed the harness ends by itself; give it a moment.
            for (int i = 0; i < 50 && ::waitpid(pid_, &status, WNOHANG) == 0; ++i) ::usleep(20000);
            if (::waitpid(pid_, &status, WNOHANG) == 0) {
                ::kill(pid_, SIGKILL);
                ::waitpid(pid_, &status, 0);
            }
        }
    }
    std::error_code ignored;
    if (!errorFile_.empty()) std::filesystem::remove(errorFile_, ignored);
    if (lockFd_ >= 0) ::close(lockFd_);
}

int WineProcess::wait()
{
    if (toHost_ >= 0) ::close(toHost_);
    toHost_ = -1;
    int status = 0;
    if (pid_ > 0 && ::waitpid(pid_, &status, 0) == pid_) {
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    }
    return -1;
}

void WineProcess::gone(const std::string& what)
{
    std::ifstream in(errorFile_);
    std::stringstream said;
    said << in.rdbuf();
    std::string text = said.str();
    while (!text.empty() && (text.back() == '\n' || text.back() == '\r')) text.pop_back();
    throw LabError("the Windows engine stopped (" + what + ")" + (text.empty() ? "" : ": " + text));
}

void WineProcess::send(uint32_t kind, const std::vector<uint8_t>& payload)
{
    bridge::Header header = {kind, static_cast<uint32_t>(payload.size())};
    const uint8_t* headerBytes = reinterpret_cast<const uint8_t*>(&header);
    std::vector<uint8_t> message(headerBytes, headerBytes + sizeof(header));
    message.insert(message.end(), payload.begin(), payload.end());
    size_t written = 0;
    while (written < message.size()) {
        ssize_t put = ::write(toHost_, message.data() + written, message.size() - written);
        if (put < 0 && errno == EINTR) continue;
        if (put <= 0) gone("cannot write to it");
        written += static_cast<size_t>(put);
    }
}

BridgeMessage WineProcess::receive()
{
    auto readExactly = [&](void* to, size_t size) {
        uint8_t* at = static_cast<uint8_t*>(to);
        while (size != 0) {
            ssize_t got = ::read(fromHost_, at, size);
            if (got < 0 && errno == EINTR) continue;
            if (got <= 0) gone("it closed its output");
            at += got;
            size -= static_cast<size_t>(got);
        }
    };
    bridge::Header header = {};
    readExactly(&header, sizeof(header));
    if (header.size > bridge::kMaxPayload) gone(fmt::format("a message of {} bytes", header.size));
    BridgeMessage message;
    message.kind = header.kind;
    message.payload.resize(header.size);
    if (header.size != 0) readExactly(message.payload.data(), header.size);
    return message;
}

std::vector<uint8_t> BridgePayload::bytes() const
{
    return {buffer_.begin(), buffer_.begin() + writer_.size()};
}

void writeText16(bridge::Writer& out, const std::u16string& text)
{
    out.text16(reinterpret_cast<const uint16_t*>(text.data()), static_cast<uint32_t>(text.size()));
}

std::string readText(bridge::Reader& in, bool* isNull)
{
    const uint8_t* start = nullptr;
    const uint32_t length = in.span(&start);
    if (isNull != nullptr) *isNull = start == nullptr;
    return start == nullptr ? std::string() : std::string(reinterpret_cast<const char*>(start), length);
}

std::u16string readText16(bridge::Reader& in, bool* isNull)
{
    const uint8_t* start = nullptr;
    const uint32_t units = in.span(&start, 2);
    if (isNull != nullptr) *isNull = start == nullptr;
    std::u16string text;
    for (uint32_t i = 0; start != nullptr && i < units; ++i)
        text += static_cast<char16_t>(start[2 * i] | (start[2 * i + 1] << 8));
    return text;
}

}  // namespace lab
