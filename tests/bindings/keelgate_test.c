/* SPDX-License-Identifier: Apache-2.0 */
/* The C interface as a program in C11 has it, linked to the shared library alone.
   usage: keelgate_test SERVICE */
#include <keelgate.h>

#include <stdio.h>
#include <stdlib.h>
#include <string.h>

static int passed, failed;

static void check(int sound, const char* what) {
  ++*(sound ? &passed : &failed);
  if (!sound) printf("FAILED: %s\n", what);
}

/* What a call gave, which begins with this text; nothing where that is NULL. Frees the reply. */
static void expect(int status, int expected, char** reply, const char* begin, const char* what) {
  check(status == expected, what);
  check(begin == NULL ? *reply == NULL
                      : *reply != NULL && strncmp(*reply, begin, strlen(begin)) == 0 &&
                            (*reply)[strlen(*reply) - 1] == '}',
        what);
  keelgate_free(*reply);
  *reply = (char*)&failed;
}

/* What becomes of a message, the Python package's tests see, which has its replies from here. */
static void calls(keelgate_client* client) {
  static const char text[] = "<plist><string>a</string></plist>";
  const size_t size = strlen(text);
  char* reply = (char*)&failed;
  expect(keelgate_unpack(client, "PropertyList", text, size, &reply), KEELGATE_RECORD, &reply,
         "{\"record\":\"PropertyList\",\"value\":\"a\"}", "a record");
  expect(keelgate_unpack_typed(client, text, size, &reply), KEELGATE_RECORD, &reply,
         "{\"record\":\"PropertyList\",\"value\":{\"type\":\"string\",\"value\":\"a\"}}",
         "a typed one");
  expect(keelgate_unpack(client, "PulseUserPayload", NULL, 0, &reply), KEELGATE_REJECTED, &reply,
         "{\"error\":{\"kind\":\"dataCorrupted\",", "no bytes");
  expect(keelgate_unpack(client, "PropertyList", text, 2000, &reply), KEELGATE_GIVEN_UP, &reply,
         "{\"error\":{\"kind\":\"host\",\"reason\":\"messageTooLarge\",", "too many bytes");

  const char* const records[] = {"Nothing", "VespClientMessageResult", NULL};
  for (size_t i = 0; i < sizeof records / sizeof *records; ++i)
    expect(keelgate_unpack(client, records[i], text, size, &reply), KEELGATE_WRONG_USE, &reply,
           NULL, "no such record");
  expect(keelgate_unpack_client_message(client, NULL, 1, text, size, &reply), KEELGATE_WRONG_USE,
         &reply, NULL, "no service");
  expect(keelgate_unpack(client, "PropertyList", NULL, 1, &reply), KEELGATE_WRONG_USE, &reply, NULL,
         "no message");
  expect(keelgate_unpack(NULL, "PropertyList", text, size, &reply), KEELGATE_WRONG_USE, &reply,
         NULL, "no client");
  check(keelgate_unpack(client, "PropertyList", text, size, NULL) == KEELGATE_WRONG_USE,
        "nowhere to put the reply");
}

static void openings(const char* service) {
  keelgate_options options;
  /* An older header ends earlier: what lies beyond is not touched, and has its default. */
  const size_t older = offsetof(keelgate_options, processes);
  memset(&options, 0xee, sizeof options);
  keelgate_options_init(&options, older);
  check(options.size == older && options.processes == 0xeeeeeeee, "an older program's options");
  options.service_path = service;
  keelgate_client* client = keelgate_open(&options, NULL);
  check(client != NULL, "an older program's client");
  keelgate_close(client);

  const size_t sizes[] = {0, 1, sizeof options + 1, (size_t)-1};
  for (size_t i = 0; i < sizeof sizes / sizeof *sizes; ++i) {
    char* sentence = NULL;
    keelgate_options_init(&options, sizeof options);
    options.size = sizes[i];
    check(keelgate_open(&options, &sentence) == NULL && sentence != NULL, "an unknown size");
    keelgate_free(sentence);
  }
  char* sentence = NULL;
  keelgate_options_init(&options, sizeof options);
  options.service_path = "/nowhere";
  check(keelgate_open(&options, &sentence) == NULL && strstr(sentence, "/nowhere") != NULL,
        "no service");
  keelgate_free(sentence);
  keelgate_options_init(NULL, sizeof options);
  keelgate_options_init(&options, 0);
  keelgate_free(NULL);
  keelgate_close(NULL);
}

int main(int count, char** words) {
  if (count != 2) return 2;
  keelgate_options options;
  keelgate_options_init(&options, sizeof options);
  check(options.messages_per_process == 1 && options.time_limit_ms == 5000 &&
            options.max_message == (size_t)64 << 20 && options.service_path == NULL,
        "the defaults");
  options.service_path = words[1];
  options.processes = 2;
  options.max_message = 1000;
  char* sentence = (char*)&failed;
  keelgate_client* client = keelgate_open(&options, &sentence);
  check(client != NULL && sentence == NULL, "a client");
  if (client == NULL) return 1;
  calls(client);
  keelgate_close(client);
  openings(words[1]);
  check(strcmp(keelgate_version(), "") != 0, "a version");
  printf("%d passed, %d failed\n", passed, failed);
  return failed != 0;
}
