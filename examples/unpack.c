/* SPDX-License-Identifier: Apache-2.0 */
/* Unpacks a push payload from C: unpack FILE */
#include <keelgate.h>

#include <stdio.h>
#include <stdlib.h>

int main(int count, char **words) {
  FILE *file = count == 2 ? fopen(words[1], "rb") : NULL;
  if (file == NULL) {
    fprintf(stderr, "usage: %s FILE, of a message that can be read\n", words[0]);
    return 2;
  }
  static char message[1 << 20];
  const size_t length = fread(message, 1, sizeof message, file);
  fclose(file);

  char *sentence = NULL;
  keelgate_client *client = keelgate_open(NULL, &sentence);
  if (client == NULL) {
    fprintf(stderr, "%s\n", sentence);
    keelgate_free(sentence);
    return 3;
  }
  char *reply = NULL;
  const int status = keelgate_unpack(client, "PulseUserPayload", message, length, &reply);
  puts(reply != NULL ? reply : "no reply");
  keelgate_free(reply);
  keelgate_close(client);
  return status;
}
