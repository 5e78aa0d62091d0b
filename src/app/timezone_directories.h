#pragma once

/// Puts "/var/db/timezone/" and then "/var/db/timezone/tz/" into the protection class that files
/// created in them are to have. A directory that is missing or cannot be opened is skipped, a host
/// that refuses the class is left alone, and neither directory is created. Reports nothing.
void prepare_timezone_directories() noexcept;
