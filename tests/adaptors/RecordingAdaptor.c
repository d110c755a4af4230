/* Writes down every call, one line each, in the file that TALLYD_TEST_RECORD names. */
#include <stdio.h>
#include <stdlib.h>

#include "framework/PithAdaptor.h"

struct Instance {
  int number;
};

static int instances;

static FILE* record(void) {
  const char* path = getenv("TALLYD_TEST_RECORD");
  return path ? fopen(path, "a") : NULL;
}

static void* create(void) {
  struct Instance* self = malloc(sizeof *self);
  if (!self) return NULL;
  self->number = ++instances;
  FILE* file = record();
  if (file) {
    fprintf(file, "create %d\n", self->number);
    fclose(file);
  }
  return self;
}

static void destroy(void* instance) {
  struct Instance* self = instance;
  FILE* file = record();
  if (file) {
    fprintf(file, "destroy %d\n", self->number);
    fclose(file);
  }
  free(self);
}

static void sendMessage(void* instance, uint16_t method, uint16_t respCode, const void* plist,
                        size_t length) {
  const struct Instance* self = instance;
  const unsigned char* bytes = plist;
  FILE* file = record();
  if (!file) return;
  fprintf(file, "message %d %u %u %s ", self->number, method, respCode, plist ? "payload" : "nothing");
  for (size_t i = 0; i < length; ++i) fprintf(file, "%02x", bytes[i]);
  fprintf(file, "\n");
  fclose(file);
}

const struct PithAdaptorClass PithAdaptor = {PITH_ADAPTOR_STRUCTURE_VERSION, create, destroy, sendMessage};
