// The plug-in mechanism: every handler of a plug-in is started once a phase, with the call's
// arguments in its environment.
#include "base/trust.h"
#include "containers.h"
#include "platform.h"
#include "platplugin.h"
#include "process.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <string>
#include <unistd.h>
#include <vector>

struct PLATPLUGIN {
    std::filesystem::path folder;
    std::string action;
    std::map<std::string, std::string, std::less<>> args;
};

namespace {

constexpr const char *kPluginRoot = "/usr/tavi/etc/plugins";

void logSkipped(const char *what, const std::filesystem::path &path, const char *kind) {
    PLATFORM_LOG("plug-in %s %s skipped: it must be a %s of root's that nobody else may write",
                 what, path.c_str(), kind);
}

int failToRead(const std::filesystem::path &path, const char *why) {
    PLATFORM_LOG("plug-in folder %s cannot be read: %s", path.c_str(), why);
    return PLATFORM_FAIL(platform::kOpenFailed);
}

// Any program in the folder is meant as a handler; others are notes, or what an editor left.
bool isProgram(const std::filesystem::path &path) {
    std::error_code error;
    return access(path.c_str(), X_OK) == 0 && !std::filesystem::is_directory(path, error);
}

bool isHandler(const std::filesystem::path &path) {
    if (!isProgram(path)) {
        return false;
    }
    if (base::look(path.c_str(), base::kRootsFile) != base::Found::Trusted) {
        logSkipped("handler", path, "file");
        return false;
    }
    return true;
}

// Adds the handlers in name order. 0, or -1 when the folder cannot be read to its end.
int findHandlers(const std::filesystem::path &folder,
                 std::vector<std::filesystem::path> &handlers) {
    switch (base::look(folder.c_str(), base::kRootsFolder)) {
    case base::Found::Nothing:
        return 0;
    case base::Found::Unreadable:
        return failToRead(folder, std::strerror(errno));
    case base::Found::Strange:
        logSkipped("folder", folder, "folder");
        return 0;
    case base::Found::Trusted:
        break;
    }
    std::error_code error;
    std::filesystem::directory_iterator entry(folder, error);
    for (; !error && entry != std::filesystem::directory_iterator(); entry.increment(error)) {
        if (isHandler(entry->path())) {
            handlers.push_back(entry->path());
        }
    }
    std::sort(handlers.begin(), handlers.end());
    return error ? failToRead(folder, error.message().c_str()) : 0;
}

// The call's arguments and the caller's environment without what looks like arguments: a handler
// that makes another call must not pass its own on to that call's handlers.
std::vector<std::string> handlerEnvironment(const PLATPLUGIN &plugin) {
    std::vector<std::string> variables;
    for (char **variable = environ; variable && *variable; ++variable) {
        const std::string_view text(*variable);
        if (!text.starts_with("ORG_") && !text.starts_with("NEW_") &&
            !plugin.args.contains(text.substr(0, text.find('=')))) {
            variables.emplace_back(text);
        }
    }
    for (const auto &[name, value] : plugin.args) {
        variables.push_back(name + "=" + value);
    }
    return variables;
}

int runHandlers(const PLATPLUGIN &plugin, const char *phase) {
    const std::vector<std::string> variables = handlerEnvironment(plugin);
    std::vector<const char *> envp;
    envp.reserve(variables.size() + 1);
    for (const std::string &variable : variables) {
        envp.push_back(variable.c_str());
    }
    envp.push_back(nullptr);

    std::vector<std::filesystem::path> handlers;
    int result = findHandlers(plugin.folder, handlers);
    for (const auto &handler : handlers) {
        const char *argv[] = {handler.c_str(), plugin.action.c_str(), phase, nullptr};
        const int status = platform::runProgram(handler.c_str(), argv, envp.data());
        if (status != 0) {
            PLATFORM_LOG("plug-in handler %s failed on %s %s (wait status %d)", handler.c_str(),
                         plugin.action.c_str(), phase, status);
            result = PLATFORM_FAIL(platform::kSystemCallFailed);
        }
    }
    return result;
}

} // namespace

int PLATPluginInit(const char *szPlugin, const char *szAction, PLATPLUGIN **ppPlugin) {
    if (!szPlugin || !szAction || !ppPlugin || *szPlugin == '\0' || *szPlugin == '.' ||
        std::strchr(szPlugin, '/')) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    *ppPlugin = platform::guarded(
        [&] {
            auto plugin = std::make_unique<PLATPLUGIN>();
            plugin->folder = std::filesystem::path(kPluginRoot) / szPlugin;
            plugin->action = szAction;
            return plugin.release();
        },
        nullptr);
    return *ppPlugin ? 0 : -1;
}

int PLATPluginSetArg(PLATPLUGIN *pPlugin, const char *szName, const char *szValue) {
    if (!pPlugin || !szName || !szValue || *szName == '\0' || std::strchr(szName, '=')) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return platform::guarded([&] { return pPlugin->args.insert_or_assign(szName, szValue), 0; },
                             -1);
}

int PLATPluginSetArgByInt(PLATPLUGIN *pPlugin, const char *szName, int value) {
    return platform::guarded(
        [&] { return PLATPluginSetArg(pPlugin, szName, std::to_string(value).c_str()); }, -1);
}

int PLATPluginAction(int phase, PLATPLUGIN *pPlugin) {
    if (!pPlugin || (phase != PLATPLUGIN_PHASE_PRE && phase != PLATPLUGIN_PHASE_POST)) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return platform::guarded(
        [&] { return runHandlers(*pPlugin, phase == PLATPLUGIN_PHASE_PRE ? "pre" : "post"); }, -1);
}

int PLATPluginExit(PLATPLUGIN **ppPlugin) {
    if (!ppPlugin) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    delete *ppPlugin;
    *ppPlugin = nullptr;
    return 0;
}

namespace {

// A file that was meant as a handler begins as a script or a program does.
bool looksLikeProgram(const std::filesystem::path &path) {
    std::error_code error;
    if (!std::filesystem::is_regular_file(path, error)) {
        return false;
    }
    std::ifstream file(path, std::ios::binary);
    std::string start(4, '\0');
    file.read(start.data(), static_cast<std::streamsize>(start.size()));
    return start.starts_with("#!") || start == "\177ELF";
}

std::string faultOfHandler(const std::filesystem::path &path) {
    if (isProgram(path)) {
        return base::look(path.c_str(), base::kRootsFile) == base::Found::Trusted
                   ? ""
                   : "it must be a file of root's that nobody else may write";
    }
    return looksLikeProgram(path) ? "it is not executable" : "";
}

int listFaults(const std::filesystem::path &folder, std::vector<std::string> &faults) {
    switch (base::look(folder.c_str(), base::kRootsFolder)) {
    case base::Found::Nothing:
        return 0;
    case base::Found::Trusted:
        break;
    default:
        faults.push_back("all plug-in handlers are skipped: " + folder.string() +
                         " must belong to root, and nobody else may write it");
        return 1;
    }
    std::error_code error;
    std::filesystem::directory_iterator entry(folder, error);
    for (; !error && entry != std::filesystem::directory_iterator(); entry.increment(error)) {
        if (const std::string fault = faultOfHandler(entry->path()); !fault.empty()) {
            faults.push_back("the plug-in handler " + entry->path().string() +
                             " is skipped: " + fault);
        }
    }
    std::sort(faults.begin(), faults.end());
    return error ? failToRead(folder, error.message().c_str()) : static_cast<int>(faults.size());
}

} // namespace

int PLATPluginCheck(const char *szPlugin, PLATCSZLIST **ppFaults) {
    if (!szPlugin || !ppFaults || !*ppFaults) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return platform::guarded(
        [&] {
            (*ppFaults)->texts.clear();
            return listFaults(std::filesystem::path(kPluginRoot) / szPlugin, (*ppFaults)->texts);
        },
        -1);
}
