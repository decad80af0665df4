#ifndef KOVAPLATFORM_CORE_TEMP_NAMES_H
#define KOVAPLATFORM_CORE_TEMP_NAMES_H

/// @file The names of temporary files (base/temp_file.h): ".kovacore.0.tmp" and so on in every
/// directory, so that each writer clears what any killed one has left there.

namespace KovaPlatform {

inline constexpr char kTempPrefix[] = ".kovacore.";

} // namespace KovaPlatform

#endif
