set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR i686)
set(CMAKE_C_COMPILER gcc)
set(CMAKE_CXX_COMPILER g++)
set(CMAKE_C_FLAGS_INIT "-m32")
set(CMAKE_CXX_FLAGS_INIT "-m32")
set(CMAKE_ASM_FLAGS_INIT "-m32")
set(CMAKE_EXE_LINKER_FLAGS_INIT "-m32")
set(CMAKE_SHARED_LINKER_FLAGS_INIT "-m32")
# i386 programs run as they are where the kernel runs 32-bit x86 code, and
# under qemu-user, with the 32-bit loader, where it does not.
execute_process(COMMAND sh ${CMAKE_CURRENT_LIST_DIR}/../../scripts/probe-i386.sh OUTPUT_QUIET ERROR_QUIET
                RESULT_VARIABLE sorvel_i386_probe)
if(NOT sorvel_i386_probe EQUAL 0)
  set(CMAKE_CROSSCOMPILING_EMULATOR qemu-i386 /lib32/ld-linux.so.2)
endif()
set(CMAKE_LIBRARY_ARCHITECTURE i386-linux-gnu)
