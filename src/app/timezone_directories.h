#pragma once

/// Puts "/var/db/timezone/" and then "/var/db/timezone/tz/" into `timezone_protection_class`. A
/// directory that is missing or cannot be opened is skipped, and a failure to set the class is
/// ignored. Writes no warning and creates no directory.
void prepare_timezone_directories() noexcept;
