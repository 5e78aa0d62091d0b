#pragma once

/// Makes standard error fit for a boot console that other programs write to at the same time: each
/// warning goes out in one write (a line of more than 4,096 bytes in several), and a reader that is
/// gone is a failed write, not the end of the run.
void prepare_console();
