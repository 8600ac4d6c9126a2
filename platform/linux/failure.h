// How a call of the platform fails.
#pragma once

#include "vexo/error.h"

// Sets the platform's error, with the line where this stands, and is the failed call's result.
#define VEXO_FAILURE(error) (VLIBCErrSet(error), -1)
