/* coffer: container data structures whose records live in a caller-chosen
 * memory pool, shareable between processes. Includes every family. */
#ifndef COFFER_COFFER_H
#define COFFER_COFFER_H

#include <coffer/mempool.h>
#include <coffer/esa.h>
#include <coffer/rbt.h>
#include <coffer/hst.h>
#include <coffer/hstaa.h>

#endif
