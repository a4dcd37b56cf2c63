// Micro-benchmarks of one value call from the engine to the Java host: the JNI host bridge bound
// to the host's own SnmpHandler, serving the router profile as ./tessel run does, in a JVM this
// program starts. Calls go through the value adapters, as a request's handlers make them, from
// the thread that started the JVM (already attached, as an engine thread is after its first
// call). Only this program links libjvm; the engine library never does.
#include <benchmark/benchmark.h>
#include <jni.h>

#include <cstdio>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "engine/jni_host.h"
#include "snmp/value_adapters.h"

namespace tessel::bench {
namespace {

constexpr const char* kDataName = "router.snmprec";

JNIEnv* StartJvm() {
  std::string classPath = std::string("-Djava.class.path=") + TESSEL_HOST_JAR;
  std::string library = std::string("-Dtessel.library=") + TESSEL_LIBRARY;
  JavaVMOption options[] = {{classPath.data(), nullptr}, {library.data(), nullptr}};
  JavaVMInitArgs args{JNI_VERSION_1_8, 2, options, JNI_FALSE};
  JavaVM* vm = nullptr;
  void* env = nullptr;
  return JNI_CreateJavaVM(&vm, &env, &args) == JNI_OK ? static_cast<JNIEnv*>(env) : nullptr;
}

// new className(arguments), or nullptr (the exception described) when anything fails.
jobject Construct(JNIEnv* env, const char* className, const char* signature,
                  const std::vector<jvalue>& arguments) {
  jclass type = env->FindClass(className);
  jmethodID constructor = type ? env->GetMethodID(type, "<init>", signature) : nullptr;
  jobject object = constructor ? env->NewObjectA(type, constructor, arguments.data()) : nullptr;
  if (env->ExceptionCheck()) env->ExceptionDescribe();
  return object;
}

// The profile's device data, parsed by the host from the file's bytes.
jobject LoadDeviceData(JNIEnv* env, const char* path) {
  std::ifstream file(path, std::ios::binary);
  if (!file) return nullptr;
  const std::string bytes((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
  jclass type = env->FindClass("com/kestrelon/simulator/tessel/data/DeviceData");
  jmethodID parse = type ? env->GetStaticMethodID(type, "parse",
                                                  "(Ljava/lang/String;[B)Lcom/kestrelon/simulator/"
                                                  "tessel/data/DeviceData;")
                         : nullptr;
  jbyteArray content = env->NewByteArray(static_cast<jsize>(bytes.size()));
  if (parse == nullptr || content == nullptr) return nullptr;
  env->SetByteArrayRegion(content, 0, static_cast<jsize>(bytes.size()),
                          reinterpret_cast<const jbyte*>(bytes.data()));
  jobject data = env->CallStaticObjectMethod(type, parse, env->NewStringUTF(kDataName), content);
  if (env->ExceptionCheck()) env->ExceptionDescribe();
  return data;
}

// Binds the bridge to a NetworkSimulator and to SnmpHandler(new DeviceStore(profile data)).
bool BindJavaHost(JNIEnv* env) {
  jobject simulator = Construct(env, "com/kestrelon/simulator/tessel/NetworkSimulator", "()V", {});
  jobject data = LoadDeviceData(env, TESSEL_PROFILE);
  if (simulator == nullptr || data == nullptr) return false;
  jvalue dataArgument{};
  dataArgument.l = data;
  jvalue storeArgument{};
  storeArgument.l =
      Construct(env, "com/kestrelon/simulator/tessel/snmp/DeviceStore",
                "(Lcom/kestrelon/simulator/tessel/data/DeviceData;)V", {dataArgument});
  jobject handler =
      storeArgument.l
          ? Construct(env, "com/kestrelon/simulator/tessel/snmp/SnmpHandler",
                      "(Lcom/kestrelon/simulator/tessel/snmp/DeviceStore;)V", {storeArgument})
          : nullptr;
  JniHost& host = JniHost::Instance();
  if (handler == nullptr || !host.BindNetworkSimulator(env, env->NewGlobalRef(simulator)) ||
      !host.BindSnmpHandler(env, env->NewGlobalRef(handler))) {
    return false;
  }
  InstallHost(&host);
  return true;
}

// The fields a request handler fills for device 0 of ./tessel run's defaults.
HostValueQuery DeviceQuery(const std::string& label, const std::string& objectOid,
                           std::int32_t column, std::int32_t dataType) {
  HostValueQuery query;
  query.label = label;
  query.objectOid = objectOid;
  query.subId = std::to_string(column);
  query.column = column;
  query.dataType = dataType;
  query.databaseName = kDataName;
  query.tableName = "device0";
  query.agentAddress = "127.0.1.1";
  query.agentPort = 1161;
  return query;
}

// sysName.0 (OCTET STRING).
HostValueQuery SysNameGet() {
  HostValueQuery query = DeviceQuery("system", ".1.3.6.1.2.1.1", 5, 4);
  query.instance = ".0";
  return query;
}

// GetNext of ifDescr.2: the host answers ifDescr.3 of the same column.
HostValueQuery IfDescrGetNext() {
  HostValueQuery query = DeviceQuery("ifEntry", ".1.3.6.1.2.1.2.2.1", 2, 4);
  query.instance = ".2";
  query.nextColumn = 3;
  query.nextDataType = 2;
  return query;
}

void BM_JniScalarGet(benchmark::State& state) {
  const HostValueQuery query = SysNameGet();
  std::optional<std::string> value;
  std::uint8_t errorCode = 0;
  for (auto _ : state) {
    value = AdapterGetOidVal(query, &errorCode);
    benchmark::DoNotOptimize(value);
  }
  if (!value || errorCode != 0) state.SkipWithError("the host did not answer sysName.0");
}
BENCHMARK(BM_JniScalarGet);

void BM_JniTableGetNext(benchmark::State& state) {
  const HostValueQuery query = IfDescrGetNext();
  std::optional<std::string> value;
  std::string columnAndInstance;
  std::uint8_t errorCode = 0;
  for (auto _ : state) {
    value = AdapterTableGetNextOidVal(query, &columnAndInstance, &errorCode);
    benchmark::DoNotOptimize(value);
  }
  if (!value || errorCode != 0 || columnAndInstance != "2.3")
    state.SkipWithError("the host did not answer ifDescr.3 after ifDescr.2");
}
BENCHMARK(BM_JniTableGetNext);

// The JIT compiles the handler's methods after some thousand calls: without this the first
// benchmark would time the interpreter for a while.
void WarmUp() {
  const HostValueQuery get = SysNameGet(), getNext = IfDescrGetNext();
  std::string columnAndInstance;
  std::uint8_t errorCode = 0;
  for (int i = 0; i < 50'000; ++i) {
    benchmark::DoNotOptimize(AdapterGetOidVal(get, &errorCode));
    benchmark::DoNotOptimize(AdapterTableGetNextOidVal(getNext, &columnAndInstance, &errorCode));
  }
}

}  // namespace
}  // namespace tessel::bench

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 2;
  JNIEnv* env = tessel::bench::StartJvm();
  if (env == nullptr || !tessel::bench::BindJavaHost(env)) {
    std::fprintf(stderr, "tessel_micro_jni: cannot start the JVM or bind the Java host\n");
    return 1;
  }
  tessel::bench::WarmUp();
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}
