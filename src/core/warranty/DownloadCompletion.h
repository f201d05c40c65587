#pragma once

#include "core/warranty/KVRWarranty.h"
#include "platform/log/Completion.h"

namespace kvr {

/// The answer of a download: whether it succeeded, and the warranty or null.
using DownloadCompletion = Completion<bool, KVRWarrantyRef>;

}  // namespace kvr
