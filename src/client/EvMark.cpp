// evmark_trace: written out in assembly, because what matters of it is exactly
// what a compiler may choose otherwise. It has to begin with a nop (the kernel
// emulates a probed nop, where it would single-step anything else at ten times
// the cost), before any prologue, landing pad or instrumentation; and its
// arguments must still be in their registers there. On x86-64 the nop has five
// bytes, which is the form that newer kernels can turn into a call.
//
// The note beside it is the description of a USDT probe (the format of SystemTap,
// read by bpftrace, perf and gdb) at the same instruction.

#if defined(__x86_64__)
#define HY_NOP ".byte 0x0f, 0x1f, 0x44, 0x00, 0x00"
#define HY_TYPE "@function"
#define HY_ARGUMENTS "4@%edi 8@%rsi 8@%rdx 8@%rcx 8@%r8"
#elif defined(__aarch64__)
#define HY_NOP "nop"
#define HY_TYPE "%function"
#define HY_ARGUMENTS "4@x0 8@x1 8@x2 8@x3 8@x4"
#else
#error "evmark_trace is written for x86-64 and arm64"
#endif

// clang-format off
__asm__(
    ".pushsection .text.evmark_trace, \"ax\"\n"
    ".p2align 4\n"
    ".globl evmark_trace\n"
    ".type evmark_trace, " HY_TYPE "\n"
    "evmark_trace:\n"
    ".cfi_startproc\n"
    HY_NOP "\n"
    "ret\n"
    ".cfi_endproc\n"
    ".size evmark_trace, . - evmark_trace\n"
    ".popsection\n"

    ".pushsection .note.stapsdt, \"\", \"note\"\n"
    ".balign 4\n"
    ".4byte 2f - 1f, 4f - 3f, 3\n"
    "1: .asciz \"stapsdt\"\n"
    "2: .balign 4\n"
    "3: .8byte evmark_trace, _.stapsdt.base, 0\n"
    ".asciz \"halyard\"\n"
    ".asciz \"evmark_trace\"\n"
    ".asciz \"" HY_ARGUMENTS "\"\n"
    "4: .balign 4\n"
    ".popsection\n"

    ".ifndef _.stapsdt.base\n"
    ".pushsection .stapsdt.base, \"aG\", \"progbits\", .stapsdt.base, comdat\n"
    ".weak _.stapsdt.base\n"
    ".hidden _.stapsdt.base\n"
    "_.stapsdt.base: .space 1\n"
    ".size _.stapsdt.base, 1\n"
    ".popsection\n"
    ".endif\n");
// clang-format on
