#!/bin/sh
# Tells whether this machine runs 32-bit x86 code itself: builds a static
# i386 Linux program that only exits with status 42, and runs it. Exit status
# 0 and "native" when it ran; 1 and "no" when it did not, in which case i386
# Linux programs need qemu-i386 and 32-bit Windows programs cannot run here.
dir=$(mktemp -d) || exit 1
trap 'rm -rf "$dir"' EXIT
printf '\t.globl _start\n_start:\n\tmovl $1, %%eax\n\tmovl $42, %%ebx\n\tint $0x80\n' >"$dir/probe.S"
if gcc -m32 -nostdlib -static -o "$dir/probe" "$dir/probe.S" 2>/dev/null; then
  "$dir/probe" 2>/dev/null
  if [ $? -eq 42 ]; then
    echo native
    exit 0
  fi
fi
echo no
exit 1
