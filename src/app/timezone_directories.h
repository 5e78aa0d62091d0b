#pragma once

/// Puts "/var/db/timezone/" and then "/var/db/timezone/tz/" into data-protection class 4, before
/// the run creates a file there. A directory that is missing or cannot be opened is skipped;
/// neither is created. Reports nothing.
void prepare_timezone_directories() noexcept;

/// Puts the directory `path` into data-protection class 4. A path that cannot be opened is skipped,
/// and a host that refuses the class is left alone. Reports nothing.
void set_directory_protection_class(const char* path) noexcept;
