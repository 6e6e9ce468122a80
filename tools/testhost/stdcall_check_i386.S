/*
 * Calls a function that must remove its own arguments (stdcall) and measures
 * whether it did. cdecl itself:
 *   word sorvel_testhost_stdcall_call(void* fn, const word* args, word count,
 *                                     word* delta)
 * The arguments are pushed right to left onto a 16-byte aligned stack, as
 * the i386 System V ABI expects at a call. *delta receives the stack pointer
 * after the call minus the stack pointer before the first push: 0 when the
 * callee removed exactly its arguments. The caller's stack pointer is
 * restored whatever the callee did, so a wrong callee is counted, not fatal.
 */
        .text
        .globl  sorvel_testhost_stdcall_call
        .type   sorvel_testhost_stdcall_call, @function
sorvel_testhost_stdcall_call:
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
        .size   sorvel_testhost_stdcall_call, .-sorvel_testhost_stdcall_call
        .section .note.GNU-stack,"",@progbits
