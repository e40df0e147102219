// The vocabulary of the annotation file: its two root keys and its version,
// and the error a read reports for a file that is not there. The texts are
// stored on disk and handed to clients, so they never change.
//
// Thread safety: constants only.
#pragma once

#include <cstdint>
#include <string_view>

// The entries of an annotation, which clients set too, are in
// Quorvex/QVDConstants.h.
#include "Quorvex/QVDConstants.h"

// Root entries of the annotation file.
inline constexpr std::string_view QVVersionAnnotationsKey = "version";
inline constexpr std::string_view QVDataAnnotationsKey = "data";

// The one file version that is read and written; any other is ignored and
// replaced on the first change.
inline constexpr std::int64_t QVDAnnotationsVersion = 16;

// Reading a file that does not exist fails with this domain and code. The
// store compares only the code, so a missing file at start stays silent
// whatever layer reported it.
inline constexpr std::string_view QVDFileErrorDomain = "com.corvane.qvd.file";
inline constexpr std::int64_t QVDFileNotFoundErrorCode = 260;

// The identifier of the daemon's own per-user container.
inline constexpr std::string_view QVDContainerIdentifier = "com.corvane.qvd";
