// User look-up through the system's user database.
#include "platform.h"
#include "tavisdk.h"

#include <cerrno>
#include <memory>
#include <pwd.h>
#include <string>
#include <vector>

namespace {

// The interface's record first, so that a pointer to it is a pointer to this; the texts behind it.
struct OwnedUser {
    TAVIUSER user{};
    std::string name;
    std::string home;
    std::string shell;
};

OwnedUser *lookUp(uid_t uid) {
    std::vector<char> buffer(1024);
    passwd entry{};
    passwd *found = nullptr;
    int error = 0;
    while ((error = getpwuid_r(uid, &entry, buffer.data(), buffer.size(), &found)) == ERANGE) {
        buffer.resize(buffer.size() * 2);
    }
    if (error != 0 || !found) {
        PLATFORM_FAIL(platform::kReadWriteFailed);
        return nullptr;
    }
    auto owned = std::make_unique<OwnedUser>();
    owned->name = entry.pw_name;
    owned->home = entry.pw_dir;
    owned->shell = entry.pw_shell;
    owned->user = {.szName = owned->name.c_str(),
                   .uid = entry.pw_uid,
                   .gid = entry.pw_gid,
                   .szHome = owned->home.c_str(),
                   .szShell = owned->shell.c_str()};
    return owned.release();
}

} // namespace

int TAVIUserGetByUID(uid_t uid, TAVIUSER **ppUser) {
    if (!ppUser) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    OwnedUser *owned = platform::guarded([&] { return lookUp(uid); }, nullptr);
    *ppUser = owned ? &owned->user : nullptr;
    return owned ? 0 : -1;
}

void TAVIUserFree(TAVIUSER *pUser) {
    delete reinterpret_cast<OwnedUser *>(pUser);
}
