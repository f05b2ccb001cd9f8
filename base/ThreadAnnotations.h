// Names for clang's thread-safety attributes, so that the compiler checks which
// lock guards which field. Other compilers see nothing.
#pragma once

#if defined(__clang__)
#define SKEIN_ANNOTATION(x) __attribute__((x))
#else
#define SKEIN_ANNOTATION(x)
#endif

#define SKEIN_CAPABILITY(name) SKEIN_ANNOTATION(capability(name))
#define SKEIN_SCOPED_CAPABILITY SKEIN_ANNOTATION(scoped_lockable)
#define SKEIN_GUARDED_BY(lock) SKEIN_ANNOTATION(guarded_by(lock))
#define SKEIN_PT_GUARDED_BY(lock) SKEIN_ANNOTATION(pt_guarded_by(lock))
#define SKEIN_REQUIRES(...) SKEIN_ANNOTATION(requires_capability(__VA_ARGS__))
#define SKEIN_EXCLUDES(...) SKEIN_ANNOTATION(locks_excluded(__VA_ARGS__))
#define SKEIN_ACQUIRE(...) SKEIN_ANNOTATION(acquire_capability(__VA_ARGS__))
#define SKEIN_TRY_ACQUIRE(...) SKEIN_ANNOTATION(try_acquire_capability(__VA_ARGS__))
#define SKEIN_RELEASE(...) SKEIN_ANNOTATION(release_capability(__VA_ARGS__))
#define SKEIN_ASSERT_CAPABILITY(...) SKEIN_ANNOTATION(assert_capability(__VA_ARGS__))
#define SKEIN_NO_THREAD_SAFETY_ANALYSIS SKEIN_ANNOTATION(no_thread_safety_analysis)
