// glyphwell-bus-bridge-worker: chooses the fonts for one burst of the bridge's requests and
// writes the choice to its standard output. Started by glyphwell-bus-bridge only.
#include <signal.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "bridge/QZFontChoice.h"

int main(int argc, char** argv) {
    // Killed with the bridge: nobody would read the answer.
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    QZFontChoiceRequest request;
    if (argc < 2 || !QZParseFontChoiceArguments(argc - 1, argv + 1, &request)) {
        std::fprintf(stderr,
                     "usage: %s sender=NAME desktop=ID executable=NAME declined=PATH "
                     "[language=TAG]... [family=NAME]...\n"
                     "Started by glyphwell-bus-bridge; not for direct use.\n",
                     argv[0]);
        return 2;
    }
    const std::string answer = QZEncodeFontChoice(QZChooseFonts(request));
    for (size_t written = 0; written < answer.size();) {
        const ssize_t count =
            write(STDOUT_FILENO, answer.data() + written, answer.size() - written);
        if (count < 0 && errno == EINTR)
            continue;
        if (count <= 0)
            return 1;
        written += size_t(count);
    }
    return 0;
}
