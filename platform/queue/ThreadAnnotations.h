// clang's thread-safety attributes; empty for other compilers. A serial queue is a capability: what runs on it holds
// it.
#pragma once

#if defined(__clang__)
#define XT_ATTRIBUTE(x) __attribute__((x))
#else
#define XT_ATTRIBUTE(x)
#endif

#define XT_CAPABILITY(name) XT_ATTRIBUTE(capability(name))
#define XT_SCOPED_CAPABILITY XT_ATTRIBUTE(scoped_lockable)
#define XT_GUARDED_BY(x) XT_ATTRIBUTE(guarded_by(x))
#define XT_PT_GUARDED_BY(x) XT_ATTRIBUTE(pt_guarded_by(x))
#define XT_REQUIRES(...) XT_ATTRIBUTE(requires_capability(__VA_ARGS__))
#define XT_EXCLUDES(...) XT_ATTRIBUTE(locks_excluded(__VA_ARGS__))
#define XT_ACQUIRE(...) XT_ATTRIBUTE(acquire_capability(__VA_ARGS__))
#define XT_RELEASE(...) XT_ATTRIBUTE(release_capability(__VA_ARGS__))
#define XT_TRY_ACQUIRE(...) XT_ATTRIBUTE(try_acquire_capability(__VA_ARGS__))
#define XT_ASSERT_CAPABILITY(x) XT_ATTRIBUTE(assert_capability(x))
#define XT_RETURN_CAPABILITY(x) XT_ATTRIBUTE(lock_returned(x))
#define XT_NO_THREAD_SAFETY_ANALYSIS XT_ATTRIBUTE(no_thread_safety_analysis)
