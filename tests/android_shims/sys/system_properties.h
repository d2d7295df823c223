#pragma once

// Bionic's limits, as cutils/properties.h needs them.
#define PROP_NAME_MAX 32
#define PROP_VALUE_MAX 92
