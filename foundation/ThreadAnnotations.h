#pragma once

// Clang's thread-safety attributes: which lock or queue guards a field is written on the field, and the Clang build
// checks it. Empty for other compilers.
#if defined(__clang__)
#define TELVANE_THREAD_ATTRIBUTE(x) __attribute__((x))
#else
#define TELVANE_THREAD_ATTRIBUTE(x)
#endif

#define CAPABILITY(name) TELVANE_THREAD_ATTRIBUTE(capability(name))
#define SCOPED_CAPABILITY TELVANE_THREAD_ATTRIBUTE(scoped_lockable)
#define GUARDED_BY(lock) TELVANE_THREAD_ATTRIBUTE(guarded_by(lock))
#define PT_GUARDED_BY(lock) TELVANE_THREAD_ATTRIBUTE(pt_guarded_by(lock))
#define REQUIRES(...) TELVANE_THREAD_ATTRIBUTE(requires_capability(__VA_ARGS__))
#define EXCLUDES(...) TELVANE_THREAD_ATTRIBUTE(locks_excluded(__VA_ARGS__))
#define ACQUIRE(...) TELVANE_THREAD_ATTRIBUTE(acquire_capability(__VA_ARGS__))
#define RELEASE(...) TELVANE_THREAD_ATTRIBUTE(release_capability(__VA_ARGS__))
#define ASSERT_CAPABILITY(lock) TELVANE_THREAD_ATTRIBUTE(assert_capability(lock))
#define RETURN_CAPABILITY(lock) TELVANE_THREAD_ATTRIBUTE(lock_returned(lock))
#define NO_THREAD_SAFETY_ANALYSIS TELVANE_THREAD_ATTRIBUTE(no_thread_safety_analysis)
