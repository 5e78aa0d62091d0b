#include "app/process.h"

#include <csignal>
#include <cstdio>

#include <limits.h>

void prepare_process() {
    std::signal(SIGPIPE, SIG_IGN);
    std::signal(SIGXFSZ, SIG_IGN);

    // The longest write that a pipe takes in one piece. Static, since stderr is flushed at exit.
    static char buffer[PIPE_BUF];
    std::setvbuf(stderr, buffer, _IOLBF, sizeof buffer);
}
