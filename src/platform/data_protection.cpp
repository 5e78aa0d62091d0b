#include "platform/data_protection.h"

#ifndef MIRA_HAVE_OPEN_DPROTECTED_NP

#include <cstdarg>

int open_dprotected_np(
    const char* path, int flags, int /*protection_class*/, int protection_options, ...) {
    int permissions = 0;
    if ((flags & O_CREAT) != 0) {
        va_list arguments;
        va_start(arguments, protection_options);
        permissions = va_arg(arguments, int);
        va_end(arguments);
    }
    return ::open(path, flags, permissions);
}

#endif
