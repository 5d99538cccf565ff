// SPDX-License-Identifier: MIT
/* coffer: container data structures whose records live in a caller-chosen
 * memory pool, shareable between processes. This header brings everything a
 * program needs: the version, the platform layer (Panic and the process-shared
 * lock), the pools and every container family. */
#ifndef COFFER_COFFER_H
#define COFFER_COFFER_H

#include <coffer/version.h>
#include <coffer/platform.h>
#include <coffer/mempool.h>
#include <coffer/esa.h>
#include <coffer/rbt.h>
#include <coffer/hst.h>
#include <coffer/hstaa.h>
#include <coffer/roots.h>

#endif
