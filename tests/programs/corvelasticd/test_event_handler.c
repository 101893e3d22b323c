/* An event-handler plug-in for the tests: appends one line per commit event
 * ("<index> +<upserted> -<deleted> [keys...]") to the file named by
 * CORVELASTICD_TEST_HANDLER_OUT. */
#include <stdio.h>
#include <stdlib.h>

#include "programs/corvelasticd/corvelasticd_event_handler.h"

static void Append(const char* text, const char* index_id) {
  const char* path = getenv("CORVELASTICD_TEST_HANDLER_OUT");
  FILE* out = path != NULL ? fopen(path, "a") : NULL;
  if (out == NULL) return;
  fprintf(out, "%s %s\n", text, index_id);
  fclose(out);
}

int corvelasticd_handler_open(const char* index_id) {
  Append("open", index_id);
  return 0;
}

int corvelasticd_handler_on_commit(const struct corvelasticd_commit_event* event) {
  const char* path = getenv("CORVELASTICD_TEST_HANDLER_OUT");
  FILE* out = path != NULL ? fopen(path, "a") : NULL;
  if (out == NULL) return 1;
  fprintf(out, "commit %s +%zu -%zu", event->index_id, event->upserted_count, event->deleted_count);
  for (size_t i = 0; i < event->upserted_count; ++i) fprintf(out, " +%s", event->upserted[i]);
  for (size_t i = 0; i < event->deleted_count; ++i) fprintf(out, " -%s", event->deleted[i]);
  fprintf(out, "\n");
  fclose(out);
  return 0;
}

void corvelasticd_handler_close(const char* index_id) { Append("close", index_id); }
