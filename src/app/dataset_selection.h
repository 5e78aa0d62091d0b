#pragma once

/// Decides which dataset the zoneinfo link and the ICU link name from now on: the current one, the
/// system dataset, or the latest one when the system can read it and it is newer than the one that
/// was current when the run began.
///
/// A zoneinfo link that cannot be read or names no dataset resets both links ("Invalid current
/// symlinks; resetting to system partition"). A current dataset that the system cannot read, or that
/// is older than the system's, is given up ("Symlink points at data incompatible with installed
/// system"). A latest dataset that is not taken is reported ("New update not compatible or older
/// version"); no latest link is no failure. An update that is given up, so or by a switch, touches
/// the clean-up marker, or else warns "Cannot touch file %s"; a switch is written to the version
/// record, as far as that can be written.
///
/// Throws what reading the latest link, building a dataset or switching a link throws; links that
/// were switched by then stay so.
void select_dataset();

/// Makes the system dataset current: the zoneinfo link names "/usr/share/zoneinfo.default" and the
/// ICU link is removed. Has no warning of its own and leaves the clean-up marker alone.
/// Throws what building the system dataset or switching a link throws.
void reset_to_system_partition();
