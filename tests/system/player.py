"""The messages of a player, for tests that need a stream."""

LONG_FORM_AUDIO = 7  # service type
SETUP, ROUTE_CHANGE, PLAYBACK = 0x08000008, 10, 0x08000004
START, SETUP_TYPE, STATE = 1, 5, 18


def begin_stream(client, session, application, device="Speakers", node="speakers"):
    """Reports what a player reports up to the start of its sound. Returns the function that sends its
    further messages."""
    client.begin(session, LONG_FORM_AUDIO, application)

    def send(message, category, kind):
        client.send(message, category=category, event_type=kind, reporters=[session])
    send({"session_selected_format": "F32LE 48000 Hz 2 ch"}, SETUP, SETUP_TYPE)
    send({"active_devices": device, "device_node_names": [node]}, ROUTE_CHANGE, STATE)
    send({"run": 1}, PLAYBACK, START)
    return send
