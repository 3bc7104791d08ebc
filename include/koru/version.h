/// @file
/// The version of the headers that an application is compiled with.
#ifndef KORU_VERSION_H
#define KORU_VERSION_H

/// @{
/// The three parts of the version. A binary that was linked to one release keeps running with every
/// later one that has the same first part; the second part grows when something is added.
#define KORU_VERSION_MAJOR 1
#define KORU_VERSION_MINOR 0
#define KORU_VERSION_PATCH 0
/// @}

/// The version as one number, to compare: 1.2.3 is 10203.
#define KORU_VERSION (KORU_VERSION_MAJOR * 10000 + KORU_VERSION_MINOR * 100 + KORU_VERSION_PATCH)

/// The version as text.
#define KORU_VERSION_STRING "1.0.0"

#endif
