// Authorization: the process-wide registry of mechanism identity handlers,
// and the evaluation of an ACL buffer for one requester or a set of groups.
//
// The registry's mutex is held only while rows are searched or appended; a
// lookup copies the handler pointer out under it, and handlers are called
// after it has been released, so a handler may call into the library.
#ifndef KXACL_EVAL_H
#define KXACL_EVAL_H

#include <pthread.h>

#include <kx_acl.h>

namespace kxacl {

// One registration: a handler of a handler type for a mechanism.
struct acl__id_handler_s {
    kx_uint32_t type;            // SEC_ID_HANDLER_EXPANDED or SEC_ID_HANDLER_USER
    char mech[SEC_MECH_MAX + 1]; // as registered, NUL-terminated
    sec_acl_id_handler handler;
};

// The library state. mutex guards count and id_handlers, which hold the
// registrations in the order they were made (the first match wins).
typedef struct acl__state_s {
    pthread_mutex_t mutex;
    int count;
    acl__id_handler_s *id_handlers; // count rows; null while count is 0
} acl__state_desc;

extern acl__state_desc acl__state;
extern pthread_once_t acl__init_once_block;

// Zero-fills the state and sets up its mutex; run only through the once-control.
extern "C" void acl__state_init();

inline void ensure_state_initialised() {
    pthread_once(&acl__init_once_block, acl__state_init);
}

// Stores through handler the first handler registered for type and for mech
// (ignoring case), or null when there is none; only a mutex failure fails
// (2650-131), and a handler found before a failed unlock is kept.
kx_int32_t sec__get_id_handler(kx_uint32_t type, const char *mech, sec_acl_id_handler *handler);

} // namespace kxacl

#endif
