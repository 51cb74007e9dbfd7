#ifndef VOK_FRONT_H
#define VOK_FRONT_H

// Between the front's two units: standard_front.cpp, which sees both
// interfaces and converts, and standard_exports.cpp, which sees the standard
// header alone and exports the standard names. No PKCS#11 type crosses here.

// The front's standard function list (a host ck_function_list), built on first
// use. Always valid: when the proxy library could not be loaded, its entries
// answer CKR_GENERAL_ERROR.
extern "C" void* vok_front_list(void);

#endif
