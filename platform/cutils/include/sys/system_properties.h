// The property size limits of Android's C library, which glibc does not have.
#pragma once

#define PROP_NAME_MAX 32
#define PROP_VALUE_MAX 92
