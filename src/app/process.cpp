#include "app/process.h"

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>

#include <limits.h>

void prepare_process() {
    std::set_terminate([] { std::_Exit(EXIT_FAILURE); });
    std::signal(SIGPIPE, SIG_IGN);
    std::signal(SIGXFSZ, SIG_IGN);

    // The longest write that a pipe takes in one piece; static, since the stream outlives main.
    static char buffer[PIPE_BUF];
    std::setvbuf(stderr, buffer, _IOLBF, sizeof buffer);
}
