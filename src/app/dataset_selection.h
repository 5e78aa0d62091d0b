#pragma once

/// Selects the dataset that the zoneinfo link and the ICU link name from now on:
/// - A zoneinfo link that is missing, cannot be read or names no dataset resets both links to the
///   system dataset, which is then the current one ("Invalid current symlinks; resetting to system
///   partition").
/// - A current dataset that has another ICU format than the system, or is older than the system
///   dataset, also resets them ("Symlink points at data incompatible with installed system").
/// - A latest dataset that has the system's ICU format and is newer than the current one is linked
///   and written to the version record; any other is reported ("New update not compatible or older
///   version"). It is compared with the dataset that was current when the program was started, also
///   after a reset for format or age; the manual's CAVEATS say what follows. A missing latest link
///   is no failure.
///
/// A reset for format or age, and a switch from one update to another, touch the clean-up marker
/// ("Cannot touch file %s" on failure). A failure to write the record is ignored.
///
/// Throws what reading the latest link, building a dataset or creating a link throws. Links that
/// were changed before the failure stay changed.
void select_dataset();

/// Makes the system dataset current: the zoneinfo link names "/usr/share/zoneinfo.default" and the
/// ICU link is removed; one that cannot be removed stays, with the warnings of
/// `mira_icu::make_current`. Writes no warning of its own and does not touch the clean-up marker.
/// Throws what building the system dataset or creating the zoneinfo link throws.
void reset_to_system_partition();
