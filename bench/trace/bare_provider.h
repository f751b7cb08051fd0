/* A bare tracepoint with the fields of halvox:kdebug, as the reference. LTTng includes this header
 * several times with different macros and has no ordinary include guard. */
#undef LTTNG_UST_TRACEPOINT_PROVIDER
#define LTTNG_UST_TRACEPOINT_PROVIDER halvox_bare

#undef LTTNG_UST_TRACEPOINT_INCLUDE
#define LTTNG_UST_TRACEPOINT_INCLUDE "bench/trace/bare_provider.h"

#if !defined(HALVOX_BARE_PROVIDER_H) || defined(LTTNG_UST_TRACEPOINT_HEADER_MULTI_READ)
#define HALVOX_BARE_PROVIDER_H

#include <lttng/tracepoint.h>
#include <stdint.h>

/* The macros are laid out as a record. */
/* clang-format off */
LTTNG_UST_TRACEPOINT_EVENT(
    halvox_bare, kdebug,
    LTTNG_UST_TP_ARGS(uint32_t, code_value,
                      uint64_t, arg1_value,
                      uint64_t, arg2_value,
                      uint64_t, arg3_value,
                      uint64_t, arg4_value),
    LTTNG_UST_TP_FIELDS(
        lttng_ust_field_integer_hex(uint32_t, code, code_value)
        lttng_ust_field_integer(uint64_t, arg1, arg1_value)
        lttng_ust_field_integer(uint64_t, arg2, arg2_value)
        lttng_ust_field_integer(uint64_t, arg3, arg3_value)
        lttng_ust_field_integer(uint64_t, arg4, arg4_value)))
/* clang-format on */

#endif

#include <lttng/tracepoint-event.h>
