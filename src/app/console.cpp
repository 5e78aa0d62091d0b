#include "app/console.h"

#include <csignal>
#include <cstdio>

#include <limits.h>

void prepare_console()
{
    std::signal(SIGPIPE, SIG_IGN);

    // The longest write that a pipe keeps in one piece; static, since the stream outlives main.
    static char buffer[PIPE_BUF];
    std::setvbuf(stderr, buffer, _IOLBF, sizeof buffer);
}
