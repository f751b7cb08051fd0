/* Plays a tone of one second and reports it: a session from the first to the last sample.
 *
 *   cc player.c $(pkg-config --cflags --libs halvox-client) -lm -o player
 *   ./player | aplay -t raw -f S16_LE -r 48000 -c 1
 *
 * The sound goes to standard output. The exit status is 1 if the service did not answer everything.
 */

#include <halvox.h>
#include <math.h>
#include <stdint.h>
#include <stdio.h>

enum { SESSION = 1, RATE = 48000, BLOCK = 480 };

static const uint32_t kPlayback = HALVOX_DOMAIN_SESSION | HALVOX_CATEGORY_PLAYBACK;

/* Sends one message of the session and releases it. */
static void report(halvox_client* client, halvox_dictionary* message, uint32_t category,
                   uint16_t type) {
  if (halvox_client_send(client, SESSION, message, category, type) != HALVOX_OK) {
    fprintf(stderr, "player: a message was dropped\n");
  }
  halvox_dictionary_free(message);
}

static void begin(halvox_client* client) {
  halvox_client_create_session(client, SESSION);
  halvox_client_set_service_type(client, SESSION, HALVOX_SERVICE_LONGFORMAUDIO);
  halvox_dictionary* configuration = halvox_dictionary_new();
  halvox_dictionary_set_string(configuration, "HostApplicationDisplayID", "com.example.player");
  halvox_client_set_configuration(client, SESSION, configuration);
  halvox_dictionary_free(configuration);
  halvox_client_start(client, SESSION);

  halvox_dictionary* format = halvox_dictionary_new();
  halvox_dictionary_set_string(format, "session_selected_format", "S16LE 48000 Hz 1 ch");
  report(client, format, HALVOX_DOMAIN_SESSION | HALVOX_CATEGORY_SETUP, HALVOX_EVENT_SETUP);

  halvox_dictionary* volume = halvox_dictionary_new();
  halvox_dictionary_set_double(volume, "RQSessionVolume", 0.25);
  halvox_dictionary_set_int64(volume, "RQSessionVolumePlayingState", 1);
  report(client, volume, HALVOX_CATEGORY_VOLUME, HALVOX_EVENT_STATE);

  report(client, halvox_dictionary_new(), kPlayback, HALVOX_EVENT_START);
}

static void end(halvox_client* client, int64_t frames) {
  halvox_dictionary* played = halvox_dictionary_new();
  halvox_dictionary_set_int64(played, "frames", frames);
  report(client, played, kPlayback, HALVOX_EVENT_STOP);
  halvox_client_stop(client, SESSION);
  halvox_client_destroy_session(client, SESSION);
}

/* Writes one second of a quiet tone of 440 Hz. Returns the number of written frames. */
static int64_t play(void) {
  int64_t frames = 0;
  while (frames < RATE) {
    int16_t block[BLOCK];
    for (int i = 0; i < BLOCK; i++) {
      block[i] = (int16_t)(8000 * sin(6.283185307179586 * 440 * (double)(frames + i) / RATE));
    }
    size_t written = fwrite(block, sizeof *block, BLOCK, stdout);
    frames += (int64_t)written;
    if (written < BLOCK) break;
  }
  return frames;
}

int main(void) {
  halvox_client* client = halvox_client_new(NULL);
  if (client == NULL) {
    fprintf(stderr, "player: %s\n", halvox_result_text(HALVOX_NO_MEMORY));
    return 1;
  }

  begin(client);
  end(client, play());

  /* A program that does not need to know leaves this out: the client delivers by itself. */
  halvox_result flushed = halvox_client_flush(client, 5000);
  halvox_counters counters = {.size = sizeof counters};
  halvox_client_counters(client, &counters);
  halvox_client_free(client);
  if (flushed != HALVOX_OK || counters.acknowledged != counters.accepted) {
    fprintf(stderr, "player: %llu of %llu messages were answered\n",
            (unsigned long long)counters.acknowledged, (unsigned long long)counters.accepted);
    return 1;
  }
  return 0;
}
