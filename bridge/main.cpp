// glyphwell-bus-bridge: answers the font-install requests of the session bus.
#include <cstdio>
#include <cstring>

#include "bridge/QZBusBridge.h"

int main(int argc, char** argv) {
    if (argc > 1) {
        const bool help = std::strcmp(argv[1], "--help") == 0 || std::strcmp(argv[1], "-h") == 0;
        std::fprintf(help ? stdout : stderr,
                     "usage: %s\n"
                     "Serves %s's font requests on the session bus until stopped.\n",
                     argv[0], kQZFontInstallBusName);
        return help ? 0 : 2;
    }
    return QZRunBusBridge();
}
