#pragma once

/// Prepares the process:
/// - Each line on standard error is one write, so that it does not mix with the lines of other
///   programs. A line longer than PIPE_BUF bytes takes several writes.
/// - SIGPIPE and SIGXFSZ are ignored: a write to a pipe without a reader, or to a file that may not
///   grow, fails and does not end the program.
void prepare_process();
