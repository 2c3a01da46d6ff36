// Runs the logging client's Windows code for real. Each case lays out a module (LogModule.dll)
// with or without the logging library beside it and in the working folder, sets KALBLOG_LEVEL and
// KALBLOG_FILE, loads the module, has it log, unloads it and checks which library was loaded,
// what was printed and that nothing stays loaded or open. Prints one line per case and exits
// with 1 when a check failed. Usage: KalbLogClientWindowsTest.exe (the DLLs in ..\dll).
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <io.h>
#include <iterator>
#include <regex>
#include <string>
#include <sys/stat.h>
#include <system_error>
#include <tuple>
#include <vector>
#include <windows.h>

namespace fs = std::filesystem;

namespace {

const wchar_t LIBRARY[] = L"KalbLogUtl.dll";
const wchar_t DEPENDENCY[] = L"LogDependency.dll";
const wchar_t MODULE[] = L"LogModule.dll";
// What the log file holds before a case that appends to it.
const char EARLIER_LINE[] = "earlier line\r\n";

enum Place { Nowhere = 0, Module = 1, Working = 2, Both = Module | Working };

const wchar_t PLAIN[] = L"module";
const wchar_t WIDE[] = L"m\u00f3dulo-\u65e5\u5fd7"; // outside the ANSI code page

struct Case {
    const char* name;
    Place library;     // in the module's folder, the working folder, both or neither
    Place dependency;  // a DLL the library needs; Nowhere: a library build that needs none
    bool loaded;       // the library beside the module is loaded
    const char* level; // KALBLOG_LEVEL; nullptr: unset
    bool toFile;       // KALBLOG_FILE set; otherwise the lines go to standard error
    const wchar_t* moduleFolder;
    std::vector<int> printed; // levels of the lines expected, in order
};

const Case CASES[] = {
    {"BesideModulePreferredOverWorkingFolder", Both, Nowhere, true, nullptr, true, PLAIN, {2}},
    {"OnlyInWorkingFolderIsNotLoaded", Working, Nowhere, false, "5", true, PLAIN, {}},
    {"NoLibraryIsSilent", Nowhere, Nowhere, false, "5", true, PLAIN, {}},
    {"LevelFivePrintsTraces", Module, Nowhere, true, "5", true, PLAIN, {2, 5}},
    {"LevelOnePrintsNothing", Module, Nowhere, true, "1", true, PLAIN, {}},
    {"StandardErrorWithoutFile", Module, Nowhere, true, "2", false, PLAIN, {2}},
    {"ModuleFolderOutsideAnsiCodePage", Both, Nowhere, true, "5", true, WIDE, {2, 5}},
    // The library's own dependencies: from its folder, never from the working folder.
    {"DependencyBesideLibraryIsLoaded", Module, Both, true, "2", true, PLAIN, {2}},
    {"DependencyOnlyInWorkingFolderIsNotLoaded", Module, Working, false, "5", true, PLAIN, {}},
};

class Checks {
public:
    void expect(bool ok, const std::string& what) {
        if (!ok)
            failures.push_back(what);
    }
    bool passed() const { return failures.empty(); }
    std::string report() const {
        std::string text;
        for (const std::string& failure : failures)
            text += "\n    " + failure;
        return text;
    }

private:
    std::vector<std::string> failures;
};

fs::path ownFolder() {
    wchar_t path[MAX_PATH];
    const DWORD length = GetModuleFileNameW(nullptr, path, MAX_PATH);
    return fs::path(std::wstring(path, length)).parent_path();
}

std::string readFile(const fs::path& path) {
    std::ifstream in(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

fs::path loadedPath(const wchar_t* name) {
    const HMODULE module = GetModuleHandleW(name);
    if (!module)
        return {};
    wchar_t path[MAX_PATH];
    const DWORD length = GetModuleFileNameW(module, path, MAX_PATH);
    return fs::path(std::wstring(path, length));
}

bool samePath(const fs::path& a, const fs::path& b) {
    std::error_code error;
    return fs::equivalent(a, b, error);
}

// Standard error's descriptor goes to a file until restore(), in text mode as a console's is; the
// library writes through the same C run-time, so its lines land there.
class StandardErrorCapture {
public:
    explicit StandardErrorCapture(const fs::path& file) {
        std::fflush(stderr);
        saved = _dup(2);
        const int fd =
            _wopen(file.c_str(), _O_WRONLY | _O_CREAT | _O_TRUNC | _O_TEXT, _S_IREAD | _S_IWRITE);
        if (fd >= 0) {
            _dup2(fd, 2);
            _close(fd);
        }
    }
    ~StandardErrorCapture() { restore(); }
    void restore() {
        if (saved < 0)
            return;
        std::fflush(stderr);
        _dup2(saved, 2);
        _close(saved);
        saved = -1;
    }

private:
    int saved = -1;
};

void setVariable(const char* name, const std::string& value) {
    // An empty value removes the variable.
    _putenv_s(name, value.c_str());
}

std::string expectedLine(int level, int failureLine, int traceLine) {
    const std::string from = " tests/windows/LogModule.cpp:";
    if (level == 2)
        return "[WinModule] L2" + from + std::to_string(failureLine) +
               " failed, ip: 10.0.0.7, -7, 1099511627776\r\n";
    return "[WinModule] L5" + from + std::to_string(traceLine) + " logMessages, Enter\r\n";
}

// Line ends shown.
std::string visible(std::string text) {
    for (size_t at = 0; (at = text.find_first_of("\r\n", at)) != std::string::npos; at += 2)
        text.replace(at, 1, text[at] == '\r' ? "\\r" : "\\n");
    return text;
}

std::string firstLine(const std::string& text) {
    const size_t end = text.find('\n');
    return text.substr(0, end == std::string::npos ? end : end + 1);
}

// Each line: a local time stamp with milliseconds, then the same text as on Linux. The C run-time
// writes in text mode, so lines end in CR LF.
void checkLines(Checks& checks, const std::string& output, const std::vector<int>& levels,
                int failureLine, int traceLine) {
    static const std::regex stamp(R"(\d{4}-\d\d-\d\d \d\d:\d\d:\d\d\.\d{3} )");
    std::string rest = output;
    for (const int level : levels) {
        const std::string line = expectedLine(level, failureLine, traceLine);
        std::smatch match;
        const bool stamped =
            std::regex_search(rest, match, stamp, std::regex_constants::match_continuous);
        const size_t textAt = stamped ? match.length(0) : 0;
        if (!stamped || rest.compare(textAt, line.size(), line) != 0) {
            checks.expect(false, "expected \"TIME " + visible(line) + "\", got \"" +
                                     visible(firstLine(rest)) + "\"");
            return;
        }
        rest.erase(0, textAt + line.size());
    }
    checks.expect(rest.empty(), "unexpected output: \"" + visible(rest) + "\"");
}

Checks run(const Case& row, const fs::path& dlls, const fs::path& scratch) {
    Checks checks;
    const fs::path root = scratch / row.name;
    const fs::path moduleFolder = root / row.moduleFolder;
    const fs::path working = root / L"working";
    const fs::path logFile = root / L"log.txt";
    const fs::path stderrFile = root / L"stderr.txt";
    fs::create_directories(moduleFolder);
    fs::create_directories(working);
    fs::copy_file(dlls / MODULE, moduleFolder / MODULE);
    const fs::path libraryBuild = row.dependency == Nowhere ? dlls : dlls / L"dependent";
    for (const auto& [place, file, from] : {std::tuple(row.library, LIBRARY, libraryBuild),
                                            std::tuple(row.dependency, DEPENDENCY, dlls)}) {
        if (place & Module)
            fs::copy_file(from / file, moduleFolder / file);
        if (place & Working)
            fs::copy_file(from / file, working / file);
    }
    if (row.toFile && row.loaded)
        std::ofstream(logFile, std::ios::binary) << EARLIER_LINE;

    setVariable("KALBLOG_LEVEL", row.level ? row.level : "");
    setVariable("KALBLOG_FILE", row.toFile ? logFile.string() : "");
    SetCurrentDirectoryW(working.c_str());
    int failureLine = 0;
    int traceLine = 0;
    {
        StandardErrorCapture capture(stderrFile);
        const HMODULE module = LoadLibraryW((moduleFolder / MODULE).c_str());
        checks.expect(module != nullptr, "LoadLibraryW(LogModule.dll) failed, error " +
                                             std::to_string(GetLastError()));
        if (module) {
            using LogMessages = void (*)(int*, int*);
            const auto logMessages = reinterpret_cast<LogMessages>(
                reinterpret_cast<void*>(GetProcAddress(module, "logMessages")));
            checks.expect(logMessages != nullptr, "LogModule.dll exports no logMessages");
            if (logMessages)
                logMessages(&failureLine, &traceLine);

            const fs::path library = loadedPath(LIBRARY);
            if (row.loaded)
                checks.expect(samePath(library, moduleFolder / LIBRARY),
                              "library loaded from \"" + library.u8string() +
                                  "\", not from beside the module");
            else
                checks.expect(library.empty(),
                              "library loaded from \"" + library.u8string() + "\"");
            const fs::path dependency = loadedPath(DEPENDENCY);
            checks.expect(dependency.empty() || samePath(dependency, moduleFolder / DEPENDENCY),
                          "dependency loaded from \"" + dependency.u8string() + "\"");
            FreeLibrary(module);
        }
        capture.restore();
    }
    SetCurrentDirectoryW(scratch.c_str());
    checks.expect(!GetModuleHandleW(MODULE), "LogModule.dll still loaded after FreeLibrary");
    checks.expect(!GetModuleHandleW(LIBRARY), "KalbLogUtl.dll still loaded after the module");
    checks.expect(!GetModuleHandleW(DEPENDENCY), "LogDependency.dll still loaded after the module");

    const std::string errors = readFile(stderrFile);
    if (row.toFile && row.loaded) {
        const std::string output = readFile(logFile);
        checks.expect(output.compare(0, sizeof EARLIER_LINE - 1, EARLIER_LINE) == 0,
                      "the log file was not appended to");
        checkLines(checks, output.substr(std::min(output.size(), sizeof EARLIER_LINE - 1)),
                   row.printed, failureLine, traceLine);
        checks.expect(errors.empty(), "standard error holds \"" + errors + "\"");
    } else if (row.toFile) {
        checks.expect(!fs::exists(logFile), "a log file was made without the library");
        checks.expect(errors.empty(), "standard error holds \"" + errors + "\"");
    } else {
        checkLines(checks, errors, row.printed, failureLine, traceLine);
    }

    // A file still open or a DLL still mapped cannot be deleted on Windows. Wine keeps a library
    // whose imports failed open, so that case's folder goes with the next run's.
    std::error_code error;
    fs::remove_all(root, error);
    if (row.loaded || row.dependency == Nowhere)
        checks.expect(!error, "cannot remove the case's folder: " + error.message());
    return checks;
}

} // namespace

int main() {
    const fs::path dlls = ownFolder().parent_path() / L"dll";
    const fs::path scratch = ownFolder().parent_path() / L"scratch";
    std::error_code error;
    fs::remove_all(scratch, error);
    fs::create_directories(scratch);

    int failed = 0;
    for (const Case& row : CASES) {
        Checks checks;
        try {
            checks = run(row, dlls, scratch);
        } catch (const std::exception& error) {
            checks.expect(false, error.what());
        }
        std::printf("%s %s%s\n", checks.passed() ? "ok  " : "FAIL", row.name,
                    checks.report().c_str());
        if (!checks.passed())
            ++failed;
    }
    const int total = static_cast<int>(std::size(CASES));
    std::printf("%d of %d cases passed\n", total - failed, total);
    return failed == 0 ? 0 : 1;
}
