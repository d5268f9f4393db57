#pragma once

#include "Batch.h"

#include "orvautil/FileDescriptor.h"

namespace orva::transcoder {

/// Bytes of the largest photo and of the largest rendition.
inline constexpr long long LARGEST_PHOTO = 512LL << 20;
inline constexpr long long LARGEST_RENDITION = 4LL << 20;

/// Renders the photos of `batch` that have not failed, all in one process if possible. Afterwards
/// each has a rendition in the folder, a failure or an obstacle; or the batch has an error. Any
/// thread.
void Render(Batch& batch);

/// Whether the file is a complete JPEG of an allowed size, as far as its ends show that.
bool IsRendition(const util::FileDescriptor& file);

} // namespace orva::transcoder
