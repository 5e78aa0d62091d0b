#pragma once

/// The absolute paths of the program, compiled in: no option, variable or file changes one.
namespace paths {

// The read-only system partition.
inline constexpr char system_zoneinfo[] = "/usr/share/zoneinfo.default";
inline constexpr char system_icu[] = "/usr/share/icu";
// Never opened, only compared: a local-time link into it is corrected.
inline constexpr char correctable_zoneinfo[] = "/usr/share/zoneinfo";

// Where updated datasets are installed, each in a directory named by its version text.
inline constexpr char timezone_directory[] = "/var/db/timezone/";
inline constexpr char dataset_root[] = "/var/db/timezone/tz/";
inline constexpr char latest_link[] = "/var/db/timezone/tz_latest";

// The links through which the rest of the system reads time-zone data, and a target for the last.
inline constexpr char zoneinfo_link[] = "/var/db/timezone/zoneinfo";
inline constexpr char icu_link[] = "/var/db/icutz";
inline constexpr char localtime_link[] = "/var/db/timezone/localtime";
inline constexpr char default_localtime[] = "/var/db/timezone/zoneinfo/America/Los_Angeles";

// Files that a start writes for other programs, and one that it only deletes.
inline constexpr char cleanup_marker[] = "/var/db/timezone/needs_cleanup";
inline constexpr char version_record[] = "/var/db/timezone/TZVersionDiffRecord";
inline constexpr char stale_icu[] = "/var/db/icu";

} // namespace paths
