/* Compiled as C at every build: the public header stays valid C, for hosts written in C. */
#include "zafrel/host.h"

const char *zafrel_host_header_check_protocol = ZAFREL_HOST_PROTOCOL_VERSION;
