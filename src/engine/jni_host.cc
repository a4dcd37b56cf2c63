#include "engine/jni_host.h"

#include <algorithm>
#include <new>
#include <shared_mutex>
#include <string_view>
#include <unordered_map>

#include "engine/log.h"

namespace tessel {
namespace {

constexpr jint kJniVersion = JNI_VERSION_1_8;
constexpr jint kFrameCapacity = 64;

// Detaches, when the thread ends, a thread that AttachedEnv attached; threads the host attached
// itself are left alone.
struct AttachGuard {
  JavaVM* attachedTo = nullptr;
  ~AttachGuard() {
    if (attachedTo != nullptr) attachedTo->DetachCurrentThread();
  }
};
thread_local AttachGuard attachGuard;

// True when the host raised an exception, which is then described (debug levels 2 and 3) and
// cleared.
bool ClearException(JNIEnv* env, const char* where) {
  if (!env->ExceptionCheck()) return false;
  LOG_ERROR("Exception occured in %s ...\n", where);
  if (LogEnabled(kLogError)) env->ExceptionDescribe();
  env->ExceptionClear();
  return true;
}

class LocalFrame {
 public:
  explicit LocalFrame(JNIEnv* env) : env_(env), pushed_(env->PushLocalFrame(kFrameCapacity) == 0) {
    if (!pushed_) env_->ExceptionClear();
  }
  ~LocalFrame() {
    if (pushed_) env_->PopLocalFrame(nullptr);
  }
  LocalFrame(const LocalFrame&) = delete;
  LocalFrame& operator=(const LocalFrame&) = delete;
  bool Pushed() const { return pushed_; }

 private:
  JNIEnv* env_;
  bool pushed_;
};

// A global reference, released in the thread that drops the last binding holding it.
class GlobalRef {
 public:
  GlobalRef(JavaVM* vm, JNIEnv* env, jobject object)
      : vm_(vm), object_(env->NewGlobalRef(object)) {}
  ~GlobalRef() {
    if (object_ == nullptr) return;
    if (JNIEnv* env = AttachedEnv(vm_)) env->DeleteGlobalRef(object_);
  }
  GlobalRef(const GlobalRef&) = delete;
  GlobalRef& operator=(const GlobalRef&) = delete;
  jobject Get() const { return object_; }

 private:
  JavaVM* vm_;
  jobject object_;
};

jmethodID LookUpMethod(JNIEnv* env, jclass type, const char* name, const char* signature) {
  jmethodID method = env->GetMethodID(type, name, signature);
  if (method == nullptr) {
    env->ExceptionClear();
    LOG_ERROR("unable to find method:%s\n", name);
  }
  return method;
}

// java.lang.String's UTF-8 encoder and decoder. The class never unloads, so they are looked up
// once for the life of the process.
struct JavaStrings {
  jclass stringClass = nullptr;
  jmethodID fromBytes = nullptr;  // String(byte[], String charsetName)
  jmethodID toBytes = nullptr;    // String.getBytes(String charsetName)
  jstring utf8 = nullptr;
};

const JavaStrings* LoadJavaStrings(JNIEnv* env) {
  static std::mutex mutex;
  static JavaStrings strings;
  static bool loaded = false;
  std::lock_guard<std::mutex> lock(mutex);
  if (loaded) return &strings;
  LocalFrame frame(env);
  if (!frame.Pushed()) return nullptr;
  jclass type = env->FindClass("java/lang/String");
  if (type == nullptr) {
    env->ExceptionClear();
    LOG_ERROR("unable to find class String \n");
    return nullptr;
  }
  jmethodID fromBytes = LookUpMethod(env, type, "<init>", "([BLjava/lang/String;)V");
  jmethodID toBytes = LookUpMethod(env, type, "getBytes", "(Ljava/lang/String;)[B");
  jstring utf8 = env->NewStringUTF("UTF-8");
  if (fromBytes == nullptr || toBytes == nullptr || utf8 == nullptr) {
    env->ExceptionClear();
    return nullptr;
  }
  strings = {static_cast<jclass>(env->NewGlobalRef(type)), fromBytes, toBytes,
             static_cast<jstring>(env->NewGlobalRef(utf8))};
  loaded = strings.stringClass != nullptr && strings.utf8 != nullptr;
  return loaded ? &strings : nullptr;
}

// What the engine reads of the Hashtable a scrambler returns. These classes never unload either.
struct JavaTables {
  jclass numberClass = nullptr;
  jclass stringClass = nullptr;
  jmethodID get = nullptr;              // Hashtable.get(Object)
  jmethodID keys = nullptr;             // Hashtable.keys()
  jmethodID hasMoreElements = nullptr;  // Enumeration.hasMoreElements()
  jmethodID nextElement = nullptr;      // Enumeration.nextElement()
  jmethodID intValue = nullptr;         // Number.intValue()
  jmethodID byteValue = nullptr;        // Number.byteValue()
};

const JavaTables* LoadJavaTables(JNIEnv* env) {
  static std::mutex mutex;
  static JavaTables tables;
  static bool loaded = false;
  std::lock_guard<std::mutex> lock(mutex);
  if (loaded) return &tables;
  const JavaStrings* strings = LoadJavaStrings(env);
  LocalFrame frame(env);
  if (strings == nullptr || !frame.Pushed()) return nullptr;
  jclass hashtable = env->FindClass("java/util/Hashtable");
  jclass enumeration = hashtable ? env->FindClass("java/util/Enumeration") : nullptr;
  jclass number = enumeration ? env->FindClass("java/lang/Number") : nullptr;
  if (number == nullptr) {
    env->ExceptionClear();
    LOG_ERROR("unable to find class Hashtable, Enumeration or Number \n");
    return nullptr;
  }
  JavaTables found;
  found.stringClass = strings->stringClass;
  found.get = LookUpMethod(env, hashtable, "get", "(Ljava/lang/Object;)Ljava/lang/Object;");
  found.keys = LookUpMethod(env, hashtable, "keys", "()Ljava/util/Enumeration;");
  found.hasMoreElements = LookUpMethod(env, enumeration, "hasMoreElements", "()Z");
  found.nextElement = LookUpMethod(env, enumeration, "nextElement", "()Ljava/lang/Object;");
  found.intValue = LookUpMethod(env, number, "intValue", "()I");
  found.byteValue = LookUpMethod(env, number, "byteValue", "()B");
  if (!found.get || !found.keys || !found.hasMoreElements || !found.nextElement ||
      !found.intValue || !found.byteValue)
    return nullptr;
  found.numberClass = static_cast<jclass>(env->NewGlobalRef(number));
  if (found.numberClass == nullptr) return nullptr;
  tables = found;
  loaded = true;
  return &tables;
}

// Bytes 1..127 read the same in UTF-8 and in the JVM's modified UTF-8; every other byte must be
// decoded by the JVM's own UTF-8 decoder. (char may be signed or not: compare the octet.)
bool IsPlainAscii(const std::string& text) {
  return std::all_of(text.begin(), text.end(),
                     [](unsigned char octet) { return octet != 0 && octet < 0x80; });
}

// Copies a byte[] (local reference, deleted here) into a string.
std::optional<std::string> BytesFromJava(JNIEnv* env, jbyteArray bytes) {
  if (bytes == nullptr) return std::nullopt;
  std::string text(static_cast<std::size_t>(env->GetArrayLength(bytes)), '\0');
  env->GetByteArrayRegion(bytes, 0, static_cast<jsize>(text.size()),
                          reinterpret_cast<jbyte*>(text.data()));
  env->DeleteLocalRef(bytes);
  return text;
}

// Java strings for the texts that recur in value calls (labels, OIDs, agent names and
// addresses): made once, held by global references for the life of the process, so a call
// creates Java strings only for its variable texts. Bounded: past kMaxEntries texts are no
// longer kept.
class InternedStrings {
 public:
  static constexpr std::size_t kMaxEntries = 1 << 18;

  // A global reference to the Java string for text, or nullptr when none is kept.
  jstring Find(std::string_view text) const {
    std::shared_lock<std::shared_mutex> lock(mutex_);
    auto found = strings_.find(text);
    return found == strings_.end() ? nullptr : found->second;
  }
  // Keeps local (a Java string for text) and returns the kept reference; nullptr when full.
  jstring Keep(JNIEnv* env, std::string_view text, jstring local) {
    std::unique_lock<std::shared_mutex> lock(mutex_);
    auto found = strings_.find(text);
    if (found != strings_.end()) return found->second;
    if (strings_.size() >= kMaxEntries) return nullptr;
    auto global = static_cast<jstring>(env->NewGlobalRef(local));
    if (global != nullptr) strings_.emplace(std::string(text), global);
    return global;
  }

 private:
  struct Hash {
    using is_transparent = void;
    std::size_t operator()(std::string_view text) const {
      return std::hash<std::string_view>{}(text);
    }
  };
  mutable std::shared_mutex mutex_;
  std::unordered_map<std::string, jstring, Hash, std::equal_to<>> strings_;
};

InternedStrings& Interned() {
  static auto* strings = new InternedStrings();  // never destroyed: outlives every call
  return *strings;
}

template <typename T>
class NoDestructor {
 public:
  NoDestructor() { new (storage_) T(); }
  T& Get() { return *std::launder(reinterpret_cast<T*>(storage_)); }

 private:
  alignas(T) unsigned char storage_[sizeof(T)];
};

// Value methods of the SNMP handler, in the order of kValueMethods.
enum ValueMethod : int {
  kScalarGet,
  kScalarGetNext,
  kScalarSet,
  kTableGet,
  kTableGetNext,
  kTableSet,
  kValueMethodCount
};

struct MethodName {
  const char* name;
  const char* signature;
};

constexpr MethodName kValueMethods[kValueMethodCount] = {
    {"ScalarGetOidVal",
     "(Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/"
     "String;Ljava/lang/"
     "String;IIILjava/lang/String;ILjava/lang/String;)[Ljava/lang/String;"},
    {"ScalarGetNextOidVal",
     "(Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/"
     "String;Ljava/lang/"
     "String;Ljava/lang/String;IIILjava/lang/String;ILjava/lang/String;)[Ljava/lang/String;"},
    {"SetOidVal",
     "(Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/"
     "String;Ljava/lang/"
     "String;Ljava/lang/String;IIILjava/lang/String;ILjava/lang/String;)[Ljava/lang/String;"},
    {"TableGetOidVal",
     "(Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/"
     "String;Ljava/lang/"
     "String;IIILjava/lang/String;ILjava/lang/String;)[Ljava/lang/String;"},
    {"TableGetNextOidVal",
     "(Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;IIIILjava/lang/String;Ljava/lang/"
     "String;IILjava/"
     "lang/String;ILjava/lang/String;)[Ljava/lang/String;"},
    {"TableSetOidVal",
     "(Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/"
     "String;Ljava/lang/"
     "String;Ljava/lang/String;[Ljava/lang/String;[Ljava/lang/String;[Ljava/lang/String;[Ljava/"
     "lang/"
     "String;[Ljava/lang/String;[Ljava/lang/String;IIILjava/lang/String;ILjava/lang/String;)[Ljava/"
     "lang/"
     "String;"},
};

// The handler's methods that hear of informs, in the order of InformMethod.
enum InformMethod : int { kLogResponse, kStoreDropped, kInformMethodCount };

constexpr MethodName kInformMethods[kInformMethodCount] = {
    {"LogResponseMessage",
     "(ILjava/lang/String;ILjava/lang/String;III[Ljava/lang/String;[Ljava/lang/String;[Ljava/"
     "lang/String;)V"},
    {"StoreDroppedInformMessage",
     "(IILjava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;I[Ljava/lang/"
     "String;[Ljava/lang/String;[Ljava/lang/String;)V"},
};

// The handler's scrambler: the PDU's header and bindings in, a Hashtable of replaced fields out.
constexpr MethodName kScrambleMethod = {
    "ScramblePDU",
    "(JLjava/lang/String;[Ljava/lang/String;[Ljava/lang/String;JBJJLjava/lang/String;IILjava/lang/"
    "String;ILjava/lang/String;Z)Ljava/util/Hashtable;"};

// The TL1 handler's methods: the acknowledgment and the response block of a command.
constexpr MethodName kTl1GetAck = {
    "getAck",
    "(Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;[Ljava/lang/"
    "String;IILjava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;)I"};
constexpr MethodName kTl1GetResponseBlock = {
    "getResponseBlock",
    "(Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;[Ljava/lang/"
    "String;IILjava/lang/String;ILjava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/"
    "lang/String;)[Ljava/lang/String;"};

// The CLI handler's methods: a line's answer (with the session's block, when the handler knows
// it), the help for '?' and the completion for TAB.
#define TESSEL_CLI_ENTER_ARGUMENTS                                                              \
  "Ljava/lang/String;ILjava/lang/String;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;" \
  "Ljava/lang/String;I"
constexpr MethodName kCliEnterResponse = {"enterResponseMethod",
                                          "(" TESSEL_CLI_ENTER_ARGUMENTS ")[Ljava/lang/String;"};
constexpr MethodName kCliEnterContextResponse = {"enterContextResponseMethod",
                                                 "(" TESSEL_CLI_ENTER_ARGUMENTS
                                                 "Ljava/lang/String;)[Ljava/lang/String;"};
#undef TESSEL_CLI_ENTER_ARGUMENTS
constexpr MethodName kCliQuestionResponse = {
    "questionResponseMethod",
    "(Ljava/lang/String;ILjava/lang/String;Ljava/lang/String;)Ljava/lang/String;"};
constexpr MethodName kCliTabResponse = {
    "tabResponseMethod",
    "(Ljava/lang/String;ILjava/lang/String;Ljava/lang/String;)Ljava/lang/String;"};

// Status methods the handler must have although the engine does not call them.
constexpr MethodName kStatusMethods[] = {{"setStatus", "(Ljava/lang/String;)V"},
                                         {"setProgressValue", "(I)V"}};

}  // namespace

struct SimulatorBinding {
  SimulatorBinding(JavaVM* vm, JNIEnv* env, jobject simulator)
      : vm(vm), object(vm, env, simulator) {}
  JavaVM* vm;
  GlobalRef object;
  jmethodID getBytes = nullptr;
  jmethodID printStatus = nullptr;
};

struct HandlerBinding {
  HandlerBinding(JavaVM* vm, JNIEnv* env, jobject handler) : vm(vm), object(vm, env, handler) {}
  JavaVM* vm;
  GlobalRef object;
  jmethodID methods[kValueMethodCount] = {};
  jmethodID informMethods[kInformMethodCount] = {};
  jmethodID scramble = nullptr;
};

struct Tl1HandlerBinding {
  Tl1HandlerBinding(JavaVM* vm, JNIEnv* env, jobject handler) : vm(vm), object(vm, env, handler) {}
  JavaVM* vm;
  GlobalRef object;
  jmethodID getAck = nullptr;
  jmethodID getResponseBlock = nullptr;
};

struct CliHandlerBinding {
  CliHandlerBinding(JavaVM* vm, JNIEnv* env, jobject handler) : vm(vm), object(vm, env, handler) {}
  JavaVM* vm;
  GlobalRef object;
  jmethodID enter = nullptr;
  jmethodID enterWithContext = nullptr;  // optional
  jmethodID question = nullptr;
  jmethodID tab = nullptr;
};

// The arguments of one value call, converted in the caller's local frame.
class JavaArguments {
 public:
  explicit JavaArguments(JNIEnv* env) : env_(env) {}
  JavaArguments& Text(const std::string& text) {
    jvalue value;
    value.l = StringToJava(env_, text);
    failed_ = failed_ || value.l == nullptr;
    values_.push_back(value);
    return *this;
  }
  JavaArguments& Text(const std::optional<std::string>& text) {
    return text ? Text(*text) : Null();
  }
  // A text that recurs from call to call: passed as its kept Java string.
  JavaArguments& Constant(const std::string& text) {
    jvalue value;
    value.l = Interned().Find(text);
    if (value.l == nullptr) {
      jstring local = StringToJava(env_, text);
      value.l = local == nullptr ? nullptr : Interned().Keep(env_, text, local);
      if (value.l == nullptr) value.l = local;
    }
    failed_ = failed_ || value.l == nullptr;
    values_.push_back(value);
    return *this;
  }
  JavaArguments& Constant(const std::optional<std::string>& text) {
    return text ? Constant(*text) : Null();
  }
  JavaArguments& Int(std::int32_t number) {
    jvalue value;
    value.i = number;
    values_.push_back(value);
    return *this;
  }
  JavaArguments& Long(std::int64_t number) {
    jvalue value;
    value.j = number;
    values_.push_back(value);
    return *this;
  }
  JavaArguments& Byte(std::uint8_t octet) {
    jvalue value;
    value.b = static_cast<jbyte>(octet);
    values_.push_back(value);
    return *this;
  }
  JavaArguments& Bool(bool flag) {
    jvalue value;
    value.z = flag ? JNI_TRUE : JNI_FALSE;
    values_.push_back(value);
    return *this;
  }
  JavaArguments& Texts(const std::vector<std::optional<std::string>>& texts) {
    jvalue value;
    value.l = OptionalStringsToJava(env_, texts);
    failed_ = failed_ || value.l == nullptr;
    values_.push_back(value);
    return *this;
  }
  JavaArguments& Texts(const std::vector<std::string>& texts) {
    jvalue value;
    value.l = StringsToJava(env_, texts, texts.size());
    failed_ = failed_ || value.l == nullptr;
    values_.push_back(value);
    return *this;
  }
  JavaArguments& Null() {
    jvalue value;
    value.l = nullptr;
    values_.push_back(value);
    return *this;
  }
  // Scalars' ".0" recurs; table instances vary with every row.
  JavaArguments& Instance(const std::optional<std::string>& instance) {
    return instance && *instance == ".0" ? Constant(*instance) : Text(instance);
  }
  // The trailing arguments every value method ends with.
  JavaArguments& AgentTail(const HostValueQuery& query) {
    return Int(query.agentId)
        .Int(query.rowStatusColumn)
        .Constant(query.agentAddress)
        .Int(query.agentPort)
        .Constant(query.syntax);
  }
  bool Failed() const { return failed_; }
  const jvalue* Values() const { return values_.data(); }

 private:
  JNIEnv* env_;
  std::vector<jvalue> values_;
  bool failed_ = false;
};

JNIEnv* AttachedEnv(JavaVM* vm) {
  void* env = nullptr;
  jint status = vm->GetEnv(&env, kJniVersion);
  if (status == JNI_OK) return static_cast<JNIEnv*>(env);
  if (status != JNI_EDETACHED) return nullptr;
  char name[] = "tessel-engine";
  JavaVMAttachArgs args{kJniVersion, name, nullptr};
  if (vm->AttachCurrentThreadAsDaemon(&env, &args) != JNI_OK) return nullptr;
  attachGuard.attachedTo = vm;
  return static_cast<JNIEnv*>(env);
}

jstring StringToJava(JNIEnv* env, const std::string& text) {
  if (IsPlainAscii(text)) {
    jstring result = env->NewStringUTF(text.c_str());
    if (result == nullptr) env->ExceptionClear();
    return result;
  }
  const JavaStrings* strings = LoadJavaStrings(env);
  if (strings == nullptr) return nullptr;
  jbyteArray bytes = env->NewByteArray(static_cast<jsize>(text.size()));
  if (bytes == nullptr) {
    env->ExceptionClear();
    return nullptr;
  }
  env->SetByteArrayRegion(bytes, 0, static_cast<jsize>(text.size()),
                          reinterpret_cast<const jbyte*>(text.data()));
  auto result = static_cast<jstring>(
      env->NewObject(strings->stringClass, strings->fromBytes, bytes, strings->utf8));
  env->DeleteLocalRef(bytes);
  if (ClearException(env, "StringToJava")) return nullptr;
  return result;
}

jclass JavaStringClass(JNIEnv* env) {
  const JavaStrings* strings = LoadJavaStrings(env);
  return strings == nullptr ? nullptr : strings->stringClass;
}

jobjectArray OptionalStringsToJava(JNIEnv* env,
                                   const std::vector<std::optional<std::string>>& texts) {
  jclass stringClass = JavaStringClass(env);
  if (stringClass == nullptr) return nullptr;
  jobjectArray array = env->NewObjectArray(static_cast<jsize>(texts.size()), stringClass, nullptr);
  if (array == nullptr) {
    env->ExceptionClear();
    return nullptr;
  }
  for (std::size_t i = 0; i < texts.size(); ++i) {
    if (!texts[i]) continue;
    jstring text = StringToJava(env, *texts[i]);
    if (text == nullptr) return nullptr;
    env->SetObjectArrayElement(array, static_cast<jsize>(i), text);
    env->DeleteLocalRef(text);
  }
  return array;
}

jobjectArray StringsToJava(JNIEnv* env, const std::vector<std::string>& texts, std::size_t size) {
  jclass stringClass = JavaStringClass(env);
  if (stringClass == nullptr) return nullptr;
  jobjectArray array = env->NewObjectArray(static_cast<jsize>(size), stringClass, nullptr);
  if (array == nullptr) {
    env->ExceptionClear();
    LOG_ERROR("unable to alloc memory \n");
    return nullptr;
  }
  for (std::size_t i = 0; i < texts.size() && i < size; ++i) {
    jstring text = StringToJava(env, texts[i]);
    if (text == nullptr) return nullptr;
    env->SetObjectArrayElement(array, static_cast<jsize>(i), text);
    env->DeleteLocalRef(text);
  }
  return array;
}

JniHost& JniHost::Instance() {
  static NoDestructor<JniHost> instance;
  return instance.Get();
}

bool JniHost::BindNetworkSimulator(JNIEnv* env, jobject simulator) {
  JavaVM* vm = nullptr;
  if (simulator == nullptr || env->GetJavaVM(&vm) != JNI_OK) return false;
  LocalFrame frame(env);
  if (!frame.Pushed()) return false;
  jclass type = env->GetObjectClass(simulator);
  jmethodID getBytes = LookUpMethod(env, type, "getBytes", "(Ljava/lang/String;)[B");
  jmethodID printStatus = LookUpMethod(env, type, "printStatus", "(Ljava/lang/String;)V");
  if (getBytes == nullptr || printStatus == nullptr || LoadJavaStrings(env) == nullptr)
    return false;
  auto binding = std::make_shared<SimulatorBinding>(vm, env, simulator);
  binding->getBytes = getBytes;
  binding->printStatus = printStatus;
  std::lock_guard<std::mutex> lock(mutex_);
  simulator_ = std::move(binding);
  return true;
}

bool JniHost::BindSnmpHandler(JNIEnv* env, jobject handler) {
  JavaVM* vm = nullptr;
  if (handler == nullptr || env->GetJavaVM(&vm) != JNI_OK) {
    LOG_ERROR("error on getting JNIEnv \n");
    return false;
  }
  LocalFrame frame(env);
  if (!frame.Pushed()) return false;
  jclass type = env->GetObjectClass(handler);
  auto binding = std::make_shared<HandlerBinding>(vm, env, handler);
  for (int i = 0; i < kValueMethodCount; ++i) {
    binding->methods[i] =
        LookUpMethod(env, type, kValueMethods[i].name, kValueMethods[i].signature);
    if (binding->methods[i] == nullptr) return false;
  }
  for (int i = 0; i < kInformMethodCount; ++i) {
    binding->informMethods[i] =
        LookUpMethod(env, type, kInformMethods[i].name, kInformMethods[i].signature);
    if (binding->informMethods[i] == nullptr) return false;
  }
  binding->scramble = LookUpMethod(env, type, kScrambleMethod.name, kScrambleMethod.signature);
  if (binding->scramble == nullptr || LoadJavaTables(env) == nullptr) return false;
  for (const MethodName& method : kStatusMethods) {
    if (LookUpMethod(env, type, method.name, method.signature) == nullptr) return false;
  }
  if (LoadJavaStrings(env) == nullptr) return false;
  std::lock_guard<std::mutex> lock(mutex_);
  handler_ = std::move(binding);
  return true;
}

bool JniHost::BindTl1Handler(JNIEnv* env, jobject handler) {
  JavaVM* vm = nullptr;
  if (handler == nullptr || env->GetJavaVM(&vm) != JNI_OK) return false;
  LocalFrame frame(env);
  if (!frame.Pushed()) return false;
  jclass type = env->GetObjectClass(handler);
  auto binding = std::make_shared<Tl1HandlerBinding>(vm, env, handler);
  binding->getAck = LookUpMethod(env, type, kTl1GetAck.name, kTl1GetAck.signature);
  binding->getResponseBlock =
      LookUpMethod(env, type, kTl1GetResponseBlock.name, kTl1GetResponseBlock.signature);
  if (binding->getAck == nullptr || binding->getResponseBlock == nullptr ||
      LoadJavaStrings(env) == nullptr)
    return false;
  std::lock_guard<std::mutex> lock(mutex_);
  tl1Handler_ = std::move(binding);
  return true;
}

bool JniHost::BindCliHandler(JNIEnv* env, jobject handler) {
  JavaVM* vm = nullptr;
  if (handler == nullptr || env->GetJavaVM(&vm) != JNI_OK) return false;
  LocalFrame frame(env);
  if (!frame.Pushed()) return false;
  jclass type = env->GetObjectClass(handler);
  auto binding = std::make_shared<CliHandlerBinding>(vm, env, handler);
  binding->enterWithContext =
      env->GetMethodID(type, kCliEnterContextResponse.name, kCliEnterContextResponse.signature);
  if (binding->enterWithContext == nullptr) env->ExceptionClear();
  binding->enter = LookUpMethod(env, type, kCliEnterResponse.name, kCliEnterResponse.signature);
  binding->question =
      LookUpMethod(env, type, kCliQuestionResponse.name, kCliQuestionResponse.signature);
  binding->tab = LookUpMethod(env, type, kCliTabResponse.name, kCliTabResponse.signature);
  if (binding->enter == nullptr || binding->question == nullptr || binding->tab == nullptr ||
      LoadJavaStrings(env) == nullptr)
    return false;
  std::lock_guard<std::mutex> lock(mutex_);
  cliHandler_ = std::move(binding);
  return true;
}

std::shared_ptr<const CliHandlerBinding> JniHost::CliHandler() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return cliHandler_;
}

std::shared_ptr<const Tl1HandlerBinding> JniHost::Tl1Handler() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return tl1Handler_;
}

std::shared_ptr<const SimulatorBinding> JniHost::Simulator() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return simulator_;
}

std::shared_ptr<const HandlerBinding> JniHost::Handler() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return handler_;
}

std::optional<std::string> JniHost::ToCpp(JNIEnv* env, jstring text) {
  if (text == nullptr) return std::nullopt;
  // Plain ASCII (1..127) is the only case where the UTF-16 length equals the modified UTF-8
  // length; its bytes are the text's own and need no trip through the host.
  jsize units = env->GetStringLength(text);
  if (env->GetStringUTFLength(text) == units) {
    std::string ascii(static_cast<std::size_t>(units) + 1, '\0');
    env->GetStringUTFRegion(text, 0, units, ascii.data());
    ascii.resize(static_cast<std::size_t>(units));
    return ascii;
  }
  jobject bytes = nullptr;
  if (std::shared_ptr<const SimulatorBinding> simulator = Simulator()) {
    bytes = env->CallObjectMethod(simulator->object.Get(), simulator->getBytes, text);
  } else if (const JavaStrings* strings = LoadJavaStrings(env)) {
    bytes = env->CallObjectMethod(text, strings->toBytes, strings->utf8);
  }
  if (ClearException(env, "getBytes")) return std::nullopt;
  return BytesFromJava(env, static_cast<jbyteArray>(bytes));
}

void JniHost::PrintStatus(const std::string& text) {
  std::shared_ptr<const SimulatorBinding> simulator = Simulator();
  if (!simulator) return;
  JNIEnv* env = AttachedEnv(simulator->vm);
  if (env == nullptr) return;
  LocalFrame frame(env);
  if (!frame.Pushed()) return;
  jstring line = StringToJava(env, text);
  if (line == nullptr) return;
  env->CallVoidMethod(simulator->object.Get(), simulator->printStatus, line);
  ClearException(env, "printStatus");
}

namespace {

// Runs call(env, arguments) in a local frame of the calling thread, attached to the binding's
// JVM; failure when there is no binding, no environment or no memory, or when the arguments
// could not all be converted.
template <typename Binding, typename Result, typename Fill, typename Call>
Result CallHost(const std::shared_ptr<const Binding>& binding, Result failure, Fill fill,
                Call call) {
  if (!binding) return failure;
  JNIEnv* env = AttachedEnv(binding->vm);
  if (env == nullptr) return failure;
  LocalFrame frame(env);
  if (!frame.Pushed()) return failure;
  try {
    JavaArguments arguments(env);
    fill(arguments);
    if (arguments.Failed()) return failure;
    return call(env, arguments.Values());
  } catch (const std::bad_alloc&) {
    LOG_ERROR("unable to alloc memory \n");
    return failure;
  }
}

}  // namespace

template <typename Fill>
HostAnswer JniHost::CallValueMethod(int method, Fill fill) {
  std::shared_ptr<const HandlerBinding> handler = Handler();
  return CallHost(handler, HostAnswer{}, fill, [&](JNIEnv* env, const jvalue* values) {
    jobject answer =
        env->CallObjectMethodA(handler->object.Get(), handler->methods[method], values);
    if (ClearException(env, kValueMethods[method].name)) return HostAnswer{};
    return AnswerFromJava(env, static_cast<jobjectArray>(answer));
  });
}

HostAnswer JniHost::AnswerFromJava(JNIEnv* env, jobjectArray answer) {
  if (answer == nullptr) return std::nullopt;
  std::vector<std::optional<std::string>> texts;
  bool ok = ForEachElement(env, answer, [&](jobject element) {
    if (element == nullptr) {
      texts.emplace_back();
      return true;
    }
    texts.push_back(ToCpp(env, static_cast<jstring>(element)));
    return true;
  });
  if (!ok) return std::nullopt;
  return texts;
}

namespace {

// Scalar and table Get pass the same arguments.
void FillGetArguments(JavaArguments& a, const HostValueQuery& query) {
  a.Constant(query.label).Constant(query.objectOid).Constant(query.subId);
  a.Instance(query.instance);
  a.Constant(query.databaseName).Constant(query.tableName).Int(query.dataType).AgentTail(query);
}

}  // namespace

HostAnswer JniHost::ScalarGetOidVal(const HostValueQuery& query) {
  return CallValueMethod(kScalarGet, [&](JavaArguments& a) { FillGetArguments(a, query); });
}

HostAnswer JniHost::ScalarGetNextOidVal(const HostValueQuery& query) {
  return CallValueMethod(kScalarGetNext, [&](JavaArguments& a) {
    a.Constant(query.label)
        .Constant(query.objectOid)
        .Constant(query.subId)
        .Instance(query.instance)
        .Constant(query.previousSubId);
    a.Constant(query.databaseName).Constant(query.tableName).Int(query.dataType).AgentTail(query);
  });
}

HostAnswer JniHost::SetOidVal(const HostValueQuery& query) {
  return CallValueMethod(kScalarSet, [&](JavaArguments& a) {
    a.Constant(query.label).Constant(query.objectOid).Constant(query.subId);
    a.Instance(query.instance);
    a.Constant(query.databaseName)
        .Constant(query.tableName)
        .Text(query.valueText)
        .Int(query.dataType)
        .AgentTail(query);
  });
}

HostAnswer JniHost::TableGetOidVal(const HostValueQuery& query) {
  return CallValueMethod(kTableGet, [&](JavaArguments& a) { FillGetArguments(a, query); });
}

HostAnswer JniHost::TableGetNextOidVal(const HostValueQuery& query) {
  return CallValueMethod(kTableGetNext, [&](JavaArguments& a) {
    a.Constant(query.label).Constant(query.objectOid).Instance(query.instance);
    a.Int(query.column).Int(query.nextColumn).Int(query.dataType).Int(query.nextDataType);
    a.Constant(query.databaseName).Constant(query.tableName).AgentTail(query);
  });
}

HostAnswer JniHost::TableSetOidVal(const HostValueQuery& query) {
  return CallValueMethod(kTableSet, [&](JavaArguments& a) {
    a.Constant(query.label).Constant(query.objectOid).Constant(query.subId);
    a.Instance(query.instance);
    a.Constant(query.databaseName).Constant(query.tableName).Text(query.valueText);
    for (int i = 0; i < 6; ++i) a.Null();  // the host's row arrays, which the engine never fills
    a.Int(query.dataType).AgentTail(query);
  });
}

template <typename Fill>
void JniHost::CallInformMethod(int method, Fill fill) {
  std::shared_ptr<const HandlerBinding> handler = Handler();
  if (!handler) return;
  JNIEnv* env = AttachedEnv(handler->vm);
  if (env == nullptr) return;
  LocalFrame frame(env);
  if (!frame.Pushed()) return;
  try {
    JavaArguments arguments(env);
    fill(arguments);
    if (arguments.Failed()) return;
    env->CallVoidMethodA(handler->object.Get(), handler->informMethods[method], arguments.Values());
    ClearException(env, kInformMethods[method].name);
  } catch (const std::bad_alloc&) {
    LOG_ERROR("unable to alloc memory \n");
  }
}

void JniHost::LogResponseMessage(const InformReport& report) {
  CallInformMethod(kLogResponse, [&](JavaArguments& a) {
    a.Int(report.requestId).Text(report.managerAddress);
    a.Int(static_cast<std::int32_t>(report.informId)).Text(report.deviceAddress);
    a.Int(report.managerPort).Int(report.errorStatus).Int(report.errorIndex);
    a.Texts(report.oids).Texts(report.types).Texts(report.values);
  });
}

void JniHost::StoreDroppedInformMessage(const InformReport& report) {
  CallInformMethod(kStoreDropped, [&](JavaArguments& a) {
    a.Int(report.version).Int(static_cast<std::int32_t>(report.informId));
    a.Text(report.community).Text(report.userName).Text(report.contextName);
    a.Text(report.managerAddress).Int(report.managerPort);
    a.Texts(report.oids).Texts(report.types).Texts(report.values);
  });
}

std::optional<ScrambleChanges> JniHost::ScramblePDU(const ScrambleQuery& query) {
  std::shared_ptr<const HandlerBinding> handler = Handler();
  if (!handler || handler->scramble == nullptr) return std::nullopt;
  JNIEnv* env = AttachedEnv(handler->vm);
  if (env == nullptr) return std::nullopt;
  LocalFrame frame(env);
  if (!frame.Pushed()) return std::nullopt;
  try {
    JavaArguments a(env);
    a.Long(query.version).Text(query.community).Texts(query.oids).Texts(query.values);
    a.Long(query.requestId).Byte(query.pduType).Long(query.errorStatus).Long(query.errorIndex);
    a.Text(query.oidField).Int(query.timeout).Int(query.retries);
    a.Constant(query.agentAddress).Int(query.agentPort).Text(query.managerAddress);
    a.Bool(query.isResponse);
    if (a.Failed()) return std::nullopt;
    jobject table = env->CallObjectMethodA(handler->object.Get(), handler->scramble, a.Values());
    if (ClearException(env, kScrambleMethod.name) || table == nullptr) return std::nullopt;
    return ChangesFromJava(env, table);
  } catch (const std::bad_alloc&) {
    LOG_ERROR("unable to alloc memory \n");
    return std::nullopt;
  }
}

namespace {

// The command's fields every TL1 method begins with.
void FillTl1Command(JavaArguments& a, const Tl1HostQuery& query) {
  a.Constant(query.verb).Constant(query.modifier1).Constant(query.modifier2).Text(query.aidText);
  if (query.parameters) {
    a.Texts(*query.parameters);
  } else {
    a.Null();
  }
  a.Int(query.agentId).Int(query.reserved);
}

void FillTl1HostTexts(JavaArguments& a, const Tl1HostQuery& query) {
  a.Constant(query.hostText1).Constant(query.hostText2).Constant(query.hostText3);
  a.Constant(query.hostText2Again);
}

}  // namespace

std::int32_t JniHost::Tl1GetAck(const Tl1HostQuery& query) {
  std::shared_ptr<const Tl1HandlerBinding> handler = Tl1Handler();
  auto fill = [&](JavaArguments& a) {
    FillTl1Command(a, query);
    FillTl1HostTexts(a, query);
  };
  return CallHost(handler, std::int32_t{0}, fill, [&](JNIEnv* env, const jvalue* values) {
    jint ack = env->CallIntMethodA(handler->object.Get(), handler->getAck, values);
    return ClearException(env, kTl1GetAck.name) ? 0 : ack;
  });
}

HostAnswer JniHost::Tl1GetResponseBlock(const Tl1HostQuery& query) {
  std::shared_ptr<const Tl1HandlerBinding> handler = Tl1Handler();
  auto fill = [&](JavaArguments& a) {
    FillTl1Command(a, query);
    a.Constant(query.agentAddress).Int(query.agentPort);
    FillTl1HostTexts(a, query);
  };
  return CallHost(handler, HostAnswer{}, fill, [&](JNIEnv* env, const jvalue* values) {
    jobject answer =
        env->CallObjectMethodA(handler->object.Get(), handler->getResponseBlock, values);
    if (ClearException(env, kTl1GetResponseBlock.name)) return HostAnswer{};
    return AnswerFromJava(env, static_cast<jobjectArray>(answer));
  });
}

namespace {

enum class ScrambleKey { kInt, kByte, kText, kOther };

// How a scrambler key's value is read, and where it goes.
ScrambleKey Place(const std::string& key, ScrambleChanges* changes,
                  std::optional<std::int32_t>** number, std::optional<std::string>** text) {
  struct IntKey {
    const char* name;
    std::optional<std::int32_t> ScrambleChanges::*field;
  };
  static constexpr IntKey kIntKeys[] = {{"errstat", &ScrambleChanges::errorStatus},
                                        {"errindex", &ScrambleChanges::errorIndex},
                                        {"reqid", &ScrambleChanges::requestId},
                                        {"timeout", &ScrambleChanges::timeout},
                                        {"retries", &ScrambleChanges::retries}};
  for (const IntKey& intKey : kIntKeys) {
    if (key == intKey.name) {
      *number = &(changes->*intKey.field);
      return ScrambleKey::kInt;
    }
  }
  if (key == "command") return ScrambleKey::kByte;
  if (key == "community") *text = &changes->community;
  if (key == "oid") *text = &changes->oidField;
  return *text != nullptr ? ScrambleKey::kText : ScrambleKey::kOther;
}

}  // namespace

std::optional<ScrambleChanges> JniHost::ChangesFromJava(JNIEnv* env, jobject table) {
  const JavaTables* tables = LoadJavaTables(env);
  if (tables == nullptr) return std::nullopt;
  jobject keys = env->CallObjectMethod(table, tables->keys);
  if (ClearException(env, "keys") || keys == nullptr) return std::nullopt;
  ScrambleChanges changes;
  while (env->CallBooleanMethod(keys, tables->hasMoreElements)) {
    if (ClearException(env, "hasMoreElements")) return std::nullopt;
    jobject key = env->CallObjectMethod(keys, tables->nextElement);
    if (ClearException(env, "nextElement")) return std::nullopt;
    if (key == nullptr || !env->IsInstanceOf(key, tables->stringClass)) return std::nullopt;
    std::optional<std::string> name = ToCpp(env, static_cast<jstring>(key));
    jobject value = env->CallObjectMethod(table, tables->get, key);
    env->DeleteLocalRef(key);
    if (ClearException(env, "get") || !name || value == nullptr) return std::nullopt;
    std::optional<std::int32_t>* number = nullptr;
    std::optional<std::string>* text = nullptr;
    ScrambleKey kind = Place(*name, &changes, &number, &text);
    bool isNumber = env->IsInstanceOf(value, tables->numberClass);
    bool read = true;
    if (kind == ScrambleKey::kInt) {
      read = isNumber;
      if (read) *number = env->CallIntMethod(value, tables->intValue);
    } else if (kind == ScrambleKey::kByte) {
      read = isNumber;
      if (read)
        changes.pduType = static_cast<std::uint8_t>(env->CallByteMethod(value, tables->byteValue));
    } else if (kind == ScrambleKey::kText) {
      read = env->IsInstanceOf(value, tables->stringClass);
      if (read) *text = ToCpp(env, static_cast<jstring>(value));
      read = read && text->has_value();
    }
    env->DeleteLocalRef(value);
    if (!read || ClearException(env, "intValue")) {
      LOG_ERROR("The scrambler's value for %s is not of its type\n", name->c_str());
      return std::nullopt;
    }
  }
  if (ClearException(env, "hasMoreElements")) return std::nullopt;
  return changes;
}

HostAnswer JniHost::CliEnterResponse(const CliHostQuery& query) {
  std::shared_ptr<const CliHandlerBinding> handler = CliHandler();
  bool withContext = handler && handler->enterWithContext != nullptr;
  auto fill = [&](JavaArguments& a) {
    a.Text(query.line).Int(query.mode);
    a.Constant(query.hostText1).Constant(query.hostText2);
    a.Constant(query.hostText3).Constant(query.hostText4);
    a.Constant(query.ipAddress).Int(query.port);
    if (withContext) a.Text(query.context);
  };
  return CallHost(handler, HostAnswer{}, fill, [&](JNIEnv* env, const jvalue* values) {
    jmethodID method = withContext ? handler->enterWithContext : handler->enter;
    jobject answer = env->CallObjectMethodA(handler->object.Get(), method, values);
    if (ClearException(env, kCliEnterResponse.name)) return HostAnswer{};
    return AnswerFromJava(env, static_cast<jobjectArray>(answer));
  });
}

std::optional<std::string> JniHost::CallCliText(bool tab, const CliHostQuery& query) {
  std::shared_ptr<const CliHandlerBinding> handler = CliHandler();
  auto fill = [&](JavaArguments& a) {
    a.Text(query.line).Int(query.mode).Constant(query.hostText1).Constant(query.hostText2);
  };
  using Text = std::optional<std::string>;
  return CallHost(handler, Text{}, fill, [&](JNIEnv* env, const jvalue* values) {
    jobject text = env->CallObjectMethodA(handler->object.Get(),
                                          tab ? handler->tab : handler->question, values);
    if (ClearException(env, tab ? kCliTabResponse.name : kCliQuestionResponse.name)) return Text{};
    return ToCpp(env, static_cast<jstring>(text));
  });
}

std::optional<std::string> JniHost::CliQuestionResponse(const CliHostQuery& query) {
  return CallCliText(false, query);
}

std::optional<std::string> JniHost::CliTabResponse(const CliHostQuery& query) {
  return CallCliText(true, query);
}

}  // namespace tessel
