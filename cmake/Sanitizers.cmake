# A build folder of its own per sanitizer, e.g.
#   cmake -S . -B build-asan -G Ninja -DVEROLUX_SANITIZE=address,undefined
#   cmake -S . -B build-tsan -G Ninja -DVEROLUX_SANITIZE=thread
# Every target of the tree is instrumented; the platform's own libraries are not, which is why the
# thread sanitizer build also interposes the platform's reference counting (tests/support).
if(VEROLUX_SANITIZE)
    set(VEROLUX_SANITIZE_FLAGS -fsanitize=${VEROLUX_SANITIZE} -fno-omit-frame-pointer)
    if(VEROLUX_SANITIZE MATCHES "undefined")
        list(APPEND VEROLUX_SANITIZE_FLAGS -fno-sanitize-recover=undefined)
    endif()
    if(VEROLUX_SANITIZE MATCHES "thread" AND CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
        # gcc warns that it cannot instrument std::atomic_thread_fence; the fence that matters to
        # us, the platform fence's reference count, is annotated by hand.
        list(APPEND VEROLUX_SANITIZE_FLAGS -Wno-tsan)
    endif()
    if(VEROLUX_SANITIZE MATCHES "thread")
        add_compile_definitions(VEROLUX_THREAD_SANITIZER=1)
    endif()
    add_compile_options(${VEROLUX_SANITIZE_FLAGS})
    add_link_options(-fsanitize=${VEROLUX_SANITIZE})
endif()
