#pragma once

/// Prepares the process for a boot, where a run must go on to its end and is watched on a console
/// that other programs write to at the same time:
/// - each line of a warning goes out in one write (one of more than PIPE_BUF bytes in several);
/// - a reader of standard error that is gone, or a file that may not grow, is a failed write and
///   not the end of the run.
void prepare_process();
