#include "platform/HomeDirectory.h"

#include <cerrno>
#include <cstdlib>
#include <pwd.h>
#include <unistd.h>
#include <vector>

namespace glyphwell {

std::string PasswordDatabaseHome(const char* user) {
    long suggested = sysconf(_SC_GETPW_R_SIZE_MAX);
    std::vector<char> buffer(suggested > 0 ? size_t(suggested) : 4096);
    passwd entry{};
    passwd* found = nullptr;
    for (;;) {
        int error = user ? getpwnam_r(user, &entry, buffer.data(), buffer.size(), &found)
                         : getpwuid_r(getuid(), &entry, buffer.data(), buffer.size(), &found);
        if (error != ERANGE)
            break;
        if (buffer.size() >= (size_t(1) << 20))
            return {}; // no sane entry needs more; give up rather than grow forever
        buffer.resize(buffer.size() * 2);
    }
    if (!found || !found->pw_dir || found->pw_dir[0] != '/')
        return {};
    return found->pw_dir;
}

std::string HomeDirectory() {
    const char* home = std::getenv("HOME");
    if (home && home[0] == '/')
        return home;
    return PasswordDatabaseHome(nullptr);
}

} // namespace glyphwell
