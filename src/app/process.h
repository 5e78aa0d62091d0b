#pragma once

/// Prepares the process for a boot, where a run must go on to its end and is watched on a console
/// that other programs write to at the same time:
/// - each warning goes out in one write (a line of more than PIPE_BUF bytes in several);
/// - a reader of standard error that is gone is a failed write, not the end of the run;
/// - a failure that nothing can handle, such as no memory for an exception, ends the process with
///   status 1 and not by a signal.
void prepare_process();
