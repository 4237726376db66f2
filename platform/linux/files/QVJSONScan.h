#pragma once

#include "platform/linux/files/QVJSONFile.h"
#include "platform/linux/files/QVJSONReceiver.h"
#include "platform/linux/files/QVRegularFile.h"

// Reads a file that holds one JSON array, part by part, so that memory grows with the longest text
// in it and not with the file; without recursion, and not deeper than QVJSONFile::kMaximumDepth.
// The file is foreign: what is wrong with it may show when the receiver has had all that is before.
//
// False, with `failure` filled, where the file cannot be read, or is no such text. What the
// receiver throws ends the scan. Threads: any; a plain function.
[[nodiscard]] bool QVScanJSONArray(const QVRegularFile& file, QVJSONReceiver& receiver,
                                   QVJSONFailure& failure);
