#pragma once

/// @file One run of a task, from the walk through its sources to the report. Failures before the
/// run has begun throw std::runtime_error.

#include "task.h"

/// Runs a task, records the outcome in it and prints a report. A dry run only prints what would be
/// stored and removed.
/// Returns: 0 on success; 1 on failure; 3 if paths could not be stored, which warnings name.
int runTask(TaskFile tasks, int id, bool isDry);
