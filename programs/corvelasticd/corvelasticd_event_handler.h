/* The C interface of an index's event-handler plug-in.
 *
 * index_create names a shared library ("event_handler": {"lib_path": ...}).
 * When that file exists the daemon loads it (dlopen) for the index and tells
 * it, after every commit that changed documents, which documents changed.
 * When it does not exist the daemon logs that once and the index works
 * without it.
 *
 * A plug-in exports corvelasticd_handler_on_commit; the two others are
 * optional. Calls for one index come from one thread at a time (the index's
 * writer), after the changes are durable and visible to searches; a call
 * should return quickly, since the index's next write waits for it. */
#ifndef CORVELASTICD_EVENT_HANDLER_H_
#define CORVELASTICD_EVENT_HANDLER_H_

#include <stddef.h>

#ifdef __cplusplus
extern "C" {
#endif

#define CORVELASTICD_EVENT_HANDLER_VERSION 1

struct corvelasticd_commit_event {
  int version;                    /* CORVELASTICD_EVENT_HANDLER_VERSION */
  const char* index_id;           /* "fileindex_<share>" */
  const char* const* upserted;    /* keys of documents added or changed */
  size_t upserted_count;
  const char* const* deleted;     /* keys of documents removed (moved documents: their old key) */
  size_t deleted_count;
  int truncated;                  /* non-zero: more changed than listed; treat the index as wholly changed */
};

/* Optional: called once when the index is opened with this plug-in; non-zero refuses it. */
int corvelasticd_handler_open(const char* index_id);
/* Required: the changes of one commit. The return value is logged when non-zero. */
int corvelasticd_handler_on_commit(const struct corvelasticd_commit_event* event);
/* Optional: called once before the plug-in is unloaded (index closed, moved or deleted). */
void corvelasticd_handler_close(const char* index_id);

#ifdef __cplusplus
}
#endif

#endif /* CORVELASTICD_EVENT_HANDLER_H_ */
