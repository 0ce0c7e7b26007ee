// Clang's thread-safety annotations, which let the compiler check the lock
// rules that comments used to state: which lock guards a member, which lock
// a function needs held or must not hold. With -Wthread-safety a breach is a
// compile error; other compilers see empty macros.
//
// The reference host's copy of the module's annotations, since the host
// includes nothing of the module but its records header. The definitions are
// the same to the letter, so that code seeing both copies compiles.
#ifndef ALERTMOD_HOST_THREAD_ANNOTATIONS_H_
#define ALERTMOD_HOST_THREAD_ANNOTATIONS_H_

#if defined(__clang__)
#define ALERTMOD_THREAD_ANNOTATION(x) __attribute__((x))
#else
#define ALERTMOD_THREAD_ANNOTATION(x)
#endif

// A type whose objects are locks.
#define CAPABILITY(x) ALERTMOD_THREAD_ANNOTATION(capability(x))
// An object that holds a lock for its lifetime.
#define SCOPED_CAPABILITY ALERTMOD_THREAD_ANNOTATION(scoped_lockable)
// The member is read and written only with the lock held.
#define GUARDED_BY(x) ALERTMOD_THREAD_ANNOTATION(guarded_by(x))
// What the member points to is read and written only with the lock held.
#define PT_GUARDED_BY(x) ALERTMOD_THREAD_ANNOTATION(pt_guarded_by(x))
// The caller must hold the lock.
#define REQUIRES(...) ALERTMOD_THREAD_ANNOTATION(requires_capability(__VA_ARGS__))
// The caller must not hold the lock; the function takes it.
#define EXCLUDES(...) ALERTMOD_THREAD_ANNOTATION(locks_excluded(__VA_ARGS__))
// The function takes the lock and returns holding it.
#define ACQUIRE(...) ALERTMOD_THREAD_ANNOTATION(acquire_capability(__VA_ARGS__))
// The function lets go of a lock the caller held.
#define RELEASE(...) ALERTMOD_THREAD_ANNOTATION(release_capability(__VA_ARGS__))
// The function returns a reference to the lock.
#define RETURN_CAPABILITY(x) ALERTMOD_THREAD_ANNOTATION(lock_returned(x))
// The function is not checked; say why where it is used.
#define NO_THREAD_SAFETY_ANALYSIS ALERTMOD_THREAD_ANNOTATION(no_thread_safety_analysis)

#endif  // ALERTMOD_HOST_THREAD_ANNOTATIONS_H_
