// Handlers for division by zero on 32-bit ARM, where division is a function call. The compiler's own handlers would
// import raise(); with these, the library needs nothing of the C library but memcpy and its relatives. No input makes
// the library divide by zero.

#include <cstdint>

extern "C" {

// Names and signatures: Run-time ABI for the Arm Architecture, "Division by zero".
int32_t __aeabi_idiv0(int32_t result);
int64_t __aeabi_ldiv0(int64_t result);

int32_t __aeabi_idiv0(int32_t /*result*/)
{
    __builtin_trap();
}

int64_t __aeabi_ldiv0(int64_t /*result*/)
{
    __builtin_trap();
}
}
