// The JNI exports: thin functions that convert their arguments and call the engine.
#include <jni.h>
