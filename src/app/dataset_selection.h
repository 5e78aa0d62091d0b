#pragma once

class mira_dataset;

/// Decides which dataset the zoneinfo link and the ICU link name from now on: the current one, the
/// system dataset, or the latest one when the system can read it and it is newer.
///
/// Links that cannot be read are reset ("Invalid current symlinks; resetting to system partition").
/// A current dataset that the system cannot read, or that is older than the system's, is given up
/// ("Symlink points at data incompatible with installed system"). A latest dataset that is not
/// taken is reported ("New update not compatible or older version"); no latest link is no failure.
///
/// Throws what reading the latest link, building a dataset or switching a link throws; links that
/// were switched by then stay so.
void select_dataset();

/// Makes the system dataset current: the zoneinfo link names "/usr/share/zoneinfo.default" and the
/// ICU link is removed. Has no warning of its own and leaves the clean-up marker alone.
/// Throws what building the system dataset or switching a link throws.
void reset_to_system_partition();

/// Creates the clean-up marker, an empty file that says that an updated dataset was given up. A
/// marker that exists is left unchanged. A failure warns "Cannot touch file %s".
void touch_cleanup_marker() noexcept;

/// Writes the version record, whole and without a line end: the version text of `active`, the
/// dataset in use before the switch, an underscore, and that of `latest`. Reports no failure: the
/// record is news for others, and the switch is done.
void write_version_diff_record(const mira_dataset& active, const mira_dataset& latest) noexcept;
