#ifndef VOK_PROTO_H
#define VOK_PROTO_H

// The generated message classes name the export macro in their declarations.
#include "vok_export.h"
#include "pkcs11command.pb.h"

#endif
