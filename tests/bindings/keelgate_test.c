/* SPDX-License-Identifier: Apache-2.0 */
/* The C interface as a program in C11 has it, linked to the shared library alone.
   usage: keelgate_test SERVICE */
#include <keelgate.h>

#include <stdio.h>
#include <stdlib.h>
#include <string.h>

static int passed, failed;

static void check(int sound, const char *what) {
  ++*(sound ? &passed : &failed);
  if (!sound) printf("FAILED: %s\n", what);
}

static const char *const invitation = "<plist><dict/></plist>";
static const char *const text = "<plist><string>a</string></plist>";

/* One call each: what is returned, and what the reply begins with; NULL where there is none. */
struct row {
  const char *record, *service;
  unsigned long long command;
  const char *message;
  size_t length;
  int status;
  const char *reply;
};

static void run(keelgate_client *client, const struct row *row) {
  char *reply = (char *)&failed;
  const int status =
      row->record != NULL || row->service == NULL
          ? keelgate_unpack(client, row->record, row->message, row->length, &reply)
          : keelgate_unpack_client_message(client, row->service, row->command, row->message,
                                           row->length, &reply);
  check(status == row->status, row->reply != NULL ? row->reply : "wrong use");
  check(row->reply == NULL ? reply == NULL
                           : reply != NULL && strncmp(reply, row->reply, strlen(row->reply)) == 0,
        row->reply != NULL ? row->reply : "no reply with wrong use");
  if (reply != NULL) check(reply[strlen(reply) - 1] == '}', "a reply ends with its object");
  keelgate_free(reply);
}

static void calls(keelgate_client *client) {
  const struct row rows[] = {
      {"PropertyList", NULL, 0, text, strlen(text), KEELGATE_RECORD,
       "{\"record\":\"PropertyList\",\"value\":\"a\"}"},
      {"VespInvitation", NULL, 0, invitation, strlen(invitation), KEELGATE_REJECTED,
       "{\"error\":{\"kind\":\"keyNotFound\","},
      {"PulseUserPayload", NULL, 0, NULL, 0, KEELGATE_REJECTED,
       "{\"error\":{\"kind\":\"dataCorrupted\","},
      {NULL, "com.tessen.private.braid.viso.lp", 245, "", 0, KEELGATE_RECORD,
       "{\"record\":\"VespClientMessageResult\",\"value\":{\"messageTypeRestricted\":"},
      {NULL, "nobody", 1, NULL, 0, KEELGATE_REJECTED, "{\"error\":{\"kind\":\"unpacking\","},
      {"PropertyList", NULL, 0, text, 2000, KEELGATE_GIVEN_UP,
       "{\"error\":{\"kind\":\"host\",\"reason\":\"messageTooLarge\","},
      {"Nothing", NULL, 0, text, strlen(text), KEELGATE_WRONG_USE, NULL},
      {"VespClientMessageResult", NULL, 0, text, strlen(text), KEELGATE_WRONG_USE, NULL},
      {NULL, NULL, 0, text, strlen(text), KEELGATE_WRONG_USE, NULL},
      {"PropertyList", NULL, 0, NULL, 1, KEELGATE_WRONG_USE, NULL},
  };
  for (size_t i = 0; i < sizeof rows / sizeof *rows; ++i) run(client, &rows[i]);

  char *reply = NULL;
  check(keelgate_unpack_typed(client, text, strlen(text), &reply) == KEELGATE_RECORD &&
            strstr(reply, "{\"type\":\"string\",\"value\":\"a\"}") != NULL,
        "a typed reply");
  keelgate_free(reply);
  check(keelgate_unpack(NULL, "PropertyList", text, strlen(text), &reply) == KEELGATE_WRONG_USE &&
            reply == NULL,
        "no client");
  check(keelgate_unpack(client, "PropertyList", text, strlen(text), NULL) == KEELGATE_WRONG_USE,
        "nowhere to put the reply");
}

static void openings(const char *service) {
  keelgate_options options;
  /* An older header ends earlier: what lies beyond is not touched, and has its default. */
  const size_t older = offsetof(keelgate_options, processes);
  memset(&options, 0xee, sizeof options);
  keelgate_options_init(&options, older);
  check(options.size == older && options.processes == 0xeeeeeeee, "an older program's options");
  options.service_path = service;
  keelgate_client *client = keelgate_open(&options, NULL);
  check(client != NULL, "an older program's client");
  keelgate_close(client);

  const size_t sizes[] = {0, 1, sizeof options + 1, (size_t)-1};
  for (size_t i = 0; i < sizeof sizes / sizeof *sizes; ++i) {
    char *sentence = NULL;
    keelgate_options_init(&options, sizeof options);
    options.size = sizes[i];
    check(keelgate_open(&options, &sentence) == NULL && sentence != NULL, "an unknown size");
    keelgate_free(sentence);
  }
  char *sentence = NULL;
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

int main(int count, char **words) {
  if (count != 2) return 2;
  keelgate_options options;
  keelgate_options_init(&options, sizeof options);
  check(options.messages_per_process == 1 && options.time_limit_ms == 5000 &&
            options.max_message == (size_t)64 << 20 && options.service_path == NULL,
        "the defaults");
  options.service_path = words[1];
  options.processes = 2;
  options.max_message = 1000;
  char *sentence = (char *)&failed;
  keelgate_client *client = keelgate_open(&options, &sentence);
  check(client != NULL && sentence == NULL, "a client");
  if (client == NULL) return 1;
  calls(client);
  keelgate_close(client);
  openings(words[1]);
  check(strcmp(keelgate_version(), "") != 0, "a version");
  printf("%d passed, %d failed\n", passed, failed);
  return failed != 0;
}
