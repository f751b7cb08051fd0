#!/usr/bin/python3
"""Writes GoldenFrames.h: messages as GLib's D-Bus implementation puts them on the wire.

Run it with the system's Python, which has the GLib bindings (package python3-gi):

    /usr/bin/python3 make_golden_frames.py > GoldenFrames.h

Each case is written in both byte orders; the tests know by its name what it must decode to.
"""

from gi.repository import Gio, GLib

PATH = "/com/tarno/halvox/reporting"
INTERFACE = "com.tarno.halvox.HVReportingServiceProtocol"

TEN_FIELDS = """{
    'session_identifier': <'spotify-4711'>,
    'HostApplicationDisplayID': <'com.example.music.player'>,
    'sample_rate': <48000.0>,
    'channel_count': <uint32 2>,
    'io_buffer_size': <int32 512>,
    'active_devices': <['speaker', 'headphones']>,
    'is_playing': <true>,
    'start_time': <int64 1700000000123>,
    'glitch_count': <uint64 3>,
    'volume': <0.75>
}"""

# name, signature of all arguments, the arguments in GVariant's text form
BODIES = [
    ("bytes", "yy", "(0, 255)"),
    ("int16", "nn", "(-32768, 32767)"),
    ("uint16", "qq", "(0, 65535)"),
    ("int32", "ii", "(-2147483648, 2147483647)"),
    ("uint32", "uu", "(0, 4294967295)"),
    ("int64", "xx", "(-9223372036854775808, 9223372036854775807)"),
    ("uint64", "tt", "(0, 18446744073709551615)"),
    ("doubles", "dddd", "(1.5, nan, inf, -inf)"),
    ("booleans", "bb", "(false, true)"),
    ("strings", "sss", "('', 'plain text of more than 14 bytes', 'gr\u00fc\u00df \u20ac \U0001f600')"),
    ("paths", "oo", "('/', '/a/b_1')"),
    ("signatures", "gg", "('', 'a{sv}uqaax')"),
    ("data", "ayay", "(@ay [], [byte 0x01, 0x00, 0xff])"),
    ("dates", "y(d)", "(7, (1700000000.25,))"),
    ("date_in_variant", "v", "(<(-1.5,)>,)"),
    ("arrays", "axas", "([int64 1, -2], ['a', 'bc'])"),
    ("empty_arrays", "axasava{sv}", "(@ax [], @as [], @av [], @a{sv} {})"),
    ("nested_arrays", "aax", "([[int64 1], [], [2, 3]],)"),
    ("array_of_variants", "av", "([<int32 1>, <'two'>, <true>, <@ax []>],)"),
    ("array_of_dates", "a(d)", "([(1.0,), (2.0,)],)"),
    ("array_of_data", "aay", "([[byte 0x01], [], [0x02, 0x03]],)"),
    ("dictionary", "a{sv}", "({'one': <int32 1>, 'two': <'zwei'>},)"),
    ("dictionary_of_integers", "a{sx}", "({'a': int64 1, 'b': -1},)"),
    ("dictionary_of_bytes", "a{sy}", "({'a': byte 0x01, 'bcd': 0x02},)"),
    ("dictionary_of_arrays", "a{sas}", "({'a': ['x'], 'b': []},)"),
    ("nested_dictionaries", "a{sa{sv}}", "({'outer': {'inner': <byte 0x07>}},)"),
    ("array_of_dictionaries", "aa{sv}", "([{'a': <1.0>}, {}],)"),
    ("variants_in_variants", "v", "(<<<<int64 5>>>>,)"),
    ("many_alignments", "yqyuyxydybysygynyi",
     "(1, 2, 3, 4, 5, 6, 7, 8.5, 9, true, 11, 's', 13, 'g', 15, 16, 17, 18)"),
    ("send_message", "a{sv}uqaax", f"({TEN_FIELDS}, 14, 18, [[int64 4711]])"),
    ("send_message_without_ids", "a{sv}uqaax", "(@a{sv} {}, 1, 2, @aax [])"),
]

ORDERS = [
    ("little", Gio.DBusMessageByteOrder.LITTLE_ENDIAN),
    ("big", Gio.DBusMessageByteOrder.BIG_ENDIAN),
]


def call(member):
    return Gio.DBusMessage.new_method_call(None, PATH, INTERFACE, member)


def messages():
    """Every message with its name, without a serial number yet."""
    yield "no_arguments", call("getAllReporters")
    for name, signature, text in BODIES:
        message = call(name)
        message.set_body(GLib.Variant.parse(GLib.VariantType(f"({signature})"), text, None, None))
        yield name, message
    request = Gio.DBusMessage.new_method_call(":1.7", PATH, INTERFACE, "bus_call")
    request.set_sender(":1.42")
    request.set_serial(99)
    request.set_flags(Gio.DBusMessageFlags.NO_REPLY_EXPECTED)
    yield "bus_call", request
    reply = Gio.DBusMessage.new_method_reply(request)
    reply.set_body(GLib.Variant("(b)", (True,)))
    yield "reply", reply
    yield "error", Gio.DBusMessage.new_method_error_literal(
        request, "com.tarno.audio.reporting.Code1", "no such session")
    yield "signal", Gio.DBusMessage.new_signal("/", "org.freedesktop.DBus", "NameLost")


def hex_literals(blob):
    text = bytes(blob).hex()
    lines = [text[i:i + 92] for i in range(0, len(text), 92)]
    return "\n".join(f'     "{line}"' for line in lines)


def main():
    print("#pragma once\n")
    print("// Made by make_golden_frames.py; not to be edited.\n")
    print("#include <string_view>\n")
    print("namespace halvox::platform::linux_::dbus {\n")
    print("struct GoldenFrame {")
    print("  std::string_view name;")
    print("  bool bigEndian;")
    print("  std::string_view hex;")
    print("};\n")
    print("// clang-format off")
    print("inline constexpr GoldenFrame kGoldenFrames[] = {")
    for name, message in messages():
        for order, value in ORDERS:
            message.set_byte_order(value)
            message.set_serial(1234)
            blob = message.to_blob(Gio.DBusCapabilityFlags.NONE)
            big = "true" if order == "big" else "false"
            print(f'    {{"{name}", {big},\n{hex_literals(blob)}}},')
    print("};")
    print("// clang-format on\n")
    print("}  // namespace halvox::platform::linux_::dbus")


main()
