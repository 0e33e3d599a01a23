// Index notifications: passed on to the observer that the process registered.

#include <pthread.h>

#include "platform/include/mavocore.h"

namespace {

struct Registration {
    MAVOIndexObserver observer;
    void* context;
};

pthread_mutex_t mutex = PTHREAD_MUTEX_INITIALIZER;
Registration registered = {};

// The lock is not held during the call, so that an observer may register another.
int Notify(int which, const char* path, const char* old_path, int op) {
    pthread_mutex_lock(&mutex);
    const Registration current = registered;
    pthread_mutex_unlock(&mutex);
    if (current.observer == nullptr) return 0;
    return current.observer(current.context, which, path, old_path, op);
}

}  // namespace

int MLIBMavoFileIndexAdd(const char* szPath, const char* szOldPath, int op) {
    return Notify(MAVO_INDEX_FILE, szPath, szOldPath, op);
}

int MLIBMavoIndexAddEx(const char* szPath, const char* szOldPath, int op, int /*reserved1*/,
                       int /*reserved2*/) {
    return Notify(MAVO_INDEX_SEARCH, szPath, szOldPath, op);
}

void MAVOIndexObserverSet(MAVOIndexObserver observer, void* context) {
    pthread_mutex_lock(&mutex);
    registered = {observer, context};
    pthread_mutex_unlock(&mutex);
}
