# What makes faults of the code harder to exploit, in every optimised build. It holds for the directories of this
# project: nothing of it reaches those who link the library.

include(CheckCXXCompilerFlag)

# Sanitizers and counters look at calls that the hardening would replace.
if(CMAKE_CXX_FLAGS MATCHES "-fsanitize=|--coverage|-fprofile-(arcs|generate|instr-generate)")
  return()
endif()
set(optimised $<CONFIG:Release,RelWithDebInfo,MinSizeRel>)

# Set again, since compilers and flags of distributions set it too. The C library lowers a level that it does not know.
add_compile_options("$<${optimised}:SHELL:-U_FORTIFY_SOURCE -D_FORTIFY_SOURCE=3>"
                    $<${optimised}:-fstack-protector-strong>)
# Not for all processors; the protection of control flow has one name on x86 and another on ARM.
foreach(flag -fstack-clash-protection -fcf-protection -mbranch-protection=standard)
  string(MAKE_C_IDENTIFIER "VEMO_ATOKEN_HAS${flag}" known)
  check_cxx_compiler_flag(${flag} ${known})
  if(${known})
    add_compile_options($<${optimised}:${flag}>)
  endif()
endforeach()
add_link_options($<${optimised}:-Wl,-z,relro,-z,now,-z,defs>)
