#include "acl_io.h"
