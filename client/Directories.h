#pragma once

#include "wire/Directories.h"

namespace tamblo::client {

using wire::Directories;

} // namespace tamblo::client
