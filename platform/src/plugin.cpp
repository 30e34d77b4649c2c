// The plug-in mechanism: every handler of a plug-in is started once a phase, with the call's
// arguments in its environment.
#include "platform.h"
#include "platplugin.h"
#include "process.h"

#include <algorithm>
#include <filesystem>
#include <map>
#include <memory>
#include <string>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

struct PLATPLUGIN {
    std::filesystem::path folder;
    std::string action;
    std::map<std::string, std::string, std::less<>> args;
};

namespace {

constexpr const char *kPluginRoot = "/usr/tavi/etc/plugins";

// What runs as root must be root's alone to change.
bool isTrusted(const std::filesystem::path &path, mode_t kind) {
    struct stat status {};
    return lstat(path.c_str(), &status) == 0 && (status.st_mode & S_IFMT) == kind &&
           status.st_uid == 0 && (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

bool isHandler(const std::filesystem::path &path) {
    std::error_code error;
    if (access(path.c_str(), X_OK) != 0 || std::filesystem::is_directory(path, error)) {
        return false;
    }
    if (!isTrusted(path, S_IFREG)) {
        syslog(LOG_ERR,
               "plug-in handler %s skipped: it must be a file of root's that nobody else may write",
               path.c_str());
        return false;
    }
    return true;
}

// Adds the handlers in name order. 0, or -1 when the folder cannot be read to its end.
int findHandlers(const std::filesystem::path &folder,
                 std::vector<std::filesystem::path> &handlers) {
    std::error_code error;
    if (std::filesystem::symlink_status(folder, error).type() ==
        std::filesystem::file_type::not_found) {
        return 0;
    }
    if (!isTrusted(folder, S_IFDIR)) {
        syslog(
            LOG_ERR,
            "plug-in folder %s skipped: it must be a folder of root's that nobody else may write",
            folder.c_str());
        return 0;
    }
    std::filesystem::directory_iterator entry(folder, error);
    for (; !error && entry != std::filesystem::directory_iterator(); entry.increment(error)) {
        if (isHandler(entry->path())) {
            handlers.push_back(entry->path());
        }
    }
    std::sort(handlers.begin(), handlers.end());
    if (error) {
        PLATFORM_LOG("plug-in folder %s cannot be read: %s", folder.c_str(),
                     error.message().c_str());
        return PLATFORM_FAIL(platform::kOpenFailed);
    }
    return 0;
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
