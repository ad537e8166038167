// Division by zero on 32-bit ARM. Division is a call there, and the compiler's own handlers would import raise();
// these take their place, so that the library asks nothing of the C library but the memory functions. No input
// leads here.

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
