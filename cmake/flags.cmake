# Warning and sanitizer flags for every target, and the stricter set the
# plug-in itself is built with.
add_compile_options(-Wall -Wextra)
if(PLIMO_WERROR)
  add_compile_options(-Werror)
endif()

if(PLIMO_SANITIZE AND PLIMO_TSAN)
  message(FATAL_ERROR "PLIMO_SANITIZE and PLIMO_TSAN are exclusive")
endif()
if(PLIMO_SANITIZE)
  add_compile_options(-fsanitize=address,undefined -fno-sanitize-recover=undefined -fno-omit-frame-pointer)
  add_link_options(-fsanitize=address,undefined)
endif()
if(PLIMO_TSAN)
  add_compile_options(-fsanitize=thread -fno-omit-frame-pointer)
  add_link_options(-fsanitize=thread)
endif()

# Plug-in code: no exceptions, no RTTI, nothing visible unless marked.
set(PLIMO_PLUGIN_CXX_FLAGS -fno-exceptions -fno-rtti -fvisibility=hidden -fvisibility-inlines-hidden)
