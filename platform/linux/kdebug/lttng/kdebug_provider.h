// The tracepoint halvox:kdebug. LTTng reads this header several times with different macros.
#undef LTTNG_UST_TRACEPOINT_PROVIDER
#define LTTNG_UST_TRACEPOINT_PROVIDER halvox

#undef LTTNG_UST_TRACEPOINT_INCLUDE
#define LTTNG_UST_TRACEPOINT_INCLUDE "platform/linux/kdebug/lttng/kdebug_provider.h"

#if !defined(HALVOX_KDEBUG_PROVIDER_H) || defined(LTTNG_UST_TRACEPOINT_HEADER_MULTI_READ)
#define HALVOX_KDEBUG_PROVIDER_H

#include <lttng/tracepoint.h>
#include <stdint.h>

// Each line has one field. The formatter is disabled here, because it would join the lines.
/* clang-format off */
LTTNG_UST_TRACEPOINT_EVENT(
    halvox, kdebug,
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
