/*
 * Calls a function that must remove its own arguments (stdcall) and measures
 * whether it did. cdecl itself:
 *   word sorvel_simulated_host_stdcall_call(void* fn, const word* args, word count,
 *                                     word* delta)
 * The arguments are pushed right to left onto a 16-byte aligned stack, which
 * suits both the i386 System V ABI and Windows (4 bytes). *delta receives the
 * stack pointer after the call minus the stack pointer before the first
 * push: 0 when the callee removed exactly its arguments. The caller's stack
 * pointer is restored whatever the callee did, so a wrong callee is counted,
 * not fatal. Assembled as ELF on Linux and as COFF, where C names carry a
 * leading underscore, on Windows.
 */
#if defined(_WIN32)
#define STDCALL_CALL _sorvel_simulated_host_stdcall_call
#else
#define STDCALL_CALL sorvel_simulated_host_stdcall_call
#endif
        .text
        .globl  STDCALL_CALL
#if !defined(_WIN32)
        .type   STDCALL_CALL, @function
#endif
STDCALL_CALL:
        pushl   %ebp
        movl    %esp, %ebp
        pushl   %ebx
        pushl   %esi
        pushl   %edi
        movl    %esp, %edi              # restored after the call
        movl    12(%ebp), %esi          # args
        movl    16(%ebp), %ecx          # count
        leal    0(,%ecx,4), %eax        # bytes of arguments
        movl    %esp, %edx
        subl    %eax, %edx
        andl    $-16, %edx              # the stack pointer at the call
        addl    %eax, %edx              # the stack pointer before the pushes
        movl    %edx, %esp
        movl    %esp, %ebx              # callee-saved: survives the call
        testl   %ecx, %ecx
        jz      2f
1:      pushl   -4(%esi,%ecx,4)         # last argument first
        decl    %ecx
        jnz     1b
2:      call    *8(%ebp)
        movl    %esp, %ecx
        subl    %ebx, %ecx
        movl    20(%ebp), %edx
        movl    %ecx, (%edx)
        movl    %edi, %esp
        popl    %edi
        popl    %esi
        popl    %ebx
        popl    %ebp
        ret
#if !defined(_WIN32)
        .size   STDCALL_CALL, .-STDCALL_CALL
        .section .note.GNU-stack,"",@progbits
#endif
