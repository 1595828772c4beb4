/* What the kit's header of a trusted application is made from. */
#ifndef USER_TA_HEADER_DEFINES_H
#define USER_TA_HEADER_DEFINES_H

#include "product/uuids.h"

/*
 * OPTEE_TA_UUID: the name in product/uuids.h; OPTEE_TA_HEAP: bytes; OPTEE_TA_NAME: a word. From the
 * Makefile.
 */
#define TA_UUID OPTEE_TA_UUID

/*
 * One instance serves all sessions for as long as the device runs: it counts uses of keys and keeps
 * operations that outlast a session.
 */
#define TA_FLAGS (TA_FLAG_SINGLE_INSTANCE | TA_FLAG_MULTI_SESSION | TA_FLAG_INSTANCE_KEEP_ALIVE)

#define TA_STACK_SIZE (8 * 1024)
#define TA_DATA_SIZE OPTEE_TA_HEAP

#define TA_VERSION "1.0"
#define OPTEE_TEXT(word) #word
#define OPTEE_TEXT_OF(word) OPTEE_TEXT(word)
#define TA_DESCRIPTION OPTEE_TEXT_OF(OPTEE_TA_NAME)

#endif
