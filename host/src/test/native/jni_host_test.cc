// The host bridge against the real Java host classes in an embedded JVM: the value methods'
// signatures and argument order, texts that are not ASCII, host exceptions, and engine threads
// that attach on their own and detach when they end.
#include "engine/jni_host.h"

#include <gtest/gtest.h>

#include <thread>

namespace tessel {
namespace {

class JniHostTest : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    std::string classPath = std::string("-Djava.class.path=") + TESSEL_HOST_CLASSPATH;
    std::string library = std::string("-Dtessel.library=") + TESSEL_LIBRARY;
    JavaVMOption options[] = {{classPath.data(), nullptr},
                              {library.data(), nullptr},
                              {const_cast<char*>("-Xcheck:jni"), nullptr}};
    JavaVMInitArgs args{JNI_VERSION_1_8, 3, options, JNI_FALSE};
    void* env = nullptr;
    ASSERT_EQ(JNI_CreateJavaVM(&vm_, &env, &args), JNI_OK);
    env_ = static_cast<JNIEnv*>(env);
    simulator_ = NewObject("com/kestrelon/simulator/tessel/NetworkSimulator");
    ASSERT_TRUE(JniHost::Instance().BindNetworkSimulator(env_, simulator_));
  }

  void SetUp() override {
    jobject handler =
        ProbeCall("handler", "()Lcom/kestrelon/simulator/tessel/snmp/SnmpHandler;", nullptr);
    ASSERT_NE(handler, nullptr);
    ASSERT_TRUE(JniHost::Instance().BindSnmpHandler(env_, env_->NewGlobalRef(handler)));
  }

  static jobject NewObject(const char* className) {
    jclass type = env_->FindClass(className);
    EXPECT_NE(type, nullptr) << className;
    jobject object = env_->NewObject(type, env_->GetMethodID(type, "<init>", "()V"));
    EXPECT_NE(object, nullptr);
    return env_->NewGlobalRef(object);
  }

  static jobject ProbeCall(const char* name, const char* signature, jobject argument) {
    jclass probe = env_->FindClass("com/kestrelon/simulator/tessel/NativeProbe");
    jobject result = env_->CallStaticObjectMethod(
        probe, env_->GetStaticMethodID(probe, name, signature), argument);
    EXPECT_FALSE(env_->ExceptionCheck());
    return result;
  }

  static int ThreadsNamed(JNIEnv* env, const char* name) {
    jclass probe = env->FindClass("com/kestrelon/simulator/tessel/NativeProbe");
    jmethodID method = env->GetStaticMethodID(probe, "threadsNamed", "(Ljava/lang/String;)I");
    int count = env->CallStaticIntMethod(probe, method, env->NewStringUTF(name));
    EXPECT_FALSE(env->ExceptionCheck());
    return count;
  }

  static HostValueQuery Scalar(const std::string& subId, const std::string& value = "") {
    HostValueQuery query;
    query.label = "system";
    query.objectOid = ".1.3.6.1.2.1.1";
    query.subId = subId;
    query.instance = ".0";
    query.valueText = value;
    return query;
  }

  static HostValueQuery Column(const std::optional<std::string>& instance,
                               const std::string& value = "") {
    HostValueQuery query = Scalar("2", value);
    query.label = "ifEntry";
    query.objectOid = ".1.3.6.1.2.1.2.2.1";
    query.column = 2;
    query.nextColumn = 3;
    query.instance = instance;
    return query;
  }

  using Texts = std::vector<std::optional<std::string>>;
  static inline JavaVM* vm_ = nullptr;
  static inline JNIEnv* env_ = nullptr;
  static inline jobject simulator_ = nullptr;
};

TEST_F(JniHostTest, ScalarValuesCrossAsUtf8Bytes) {
  JniHost& host = JniHost::Instance();
  const std::string name = std::string("h\xC3\xA9llo \xE2\x82\xAC", 10) + std::string("\0x", 2);
  HostValueQuery set = Scalar("5", name);
  // The host stores the octets it received, and answers them as hex.
  const Texts stored = {"'68c3a96c6c6f20e282ac0078'h", "-1"};
  EXPECT_EQ(host.SetOidVal(set), stored);
  EXPECT_EQ(host.ScalarGetOidVal(Scalar("5")), stored);
  EXPECT_EQ(host.ScalarGetNextOidVal(Scalar("5")), stored);
  EXPECT_EQ(host.ScalarGetOidVal(Scalar("6")), std::nullopt);

  // A character outside the BMP is four octets in UTF-8 but six in the JVM's modified UTF-8.
  const std::string status = "\xC3\xA9tat \xF0\x9F\x98\x80";
  host.PrintStatus(status);
  auto line = static_cast<jstring>(ProbeCall(
      "lastStatus", "(Lcom/kestrelon/simulator/tessel/NetworkSimulator;)Ljava/lang/String;",
      simulator_));
  EXPECT_EQ(host.ToCpp(env_, line), status);
}

TEST_F(JniHostTest, TableValuesAreSetAndWalkedInColumnOrder) {
  JniHost& host = JniHost::Instance();
  const std::string eth0 = "'65746830'h", eth2 = "'65746832'h";
  EXPECT_EQ(host.TableSetOidVal(Column(".3", "eth2")), (Texts{eth2, "-1"}));
  EXPECT_EQ(host.TableSetOidVal(Column(".1", "eth0")), (Texts{eth0, "-1"}));
  EXPECT_EQ(host.TableGetOidVal(Column(".1")), (Texts{eth0, "-1"}));
  EXPECT_EQ(host.TableGetNextOidVal(Column(std::nullopt)), (Texts{eth0, "2.1", "-1"}));
  EXPECT_EQ(host.TableGetNextOidVal(Column(".1")), (Texts{eth2, "2.3", "-1"}));
  EXPECT_EQ(host.TableGetNextOidVal(Column(".3")), std::nullopt);
}

TEST_F(JniHostTest, HostExceptionIsNoAnswer) {
  JniHost& host = JniHost::Instance();
  ASSERT_TRUE(host.BindSnmpHandler(
      env_, NewObject("com/kestrelon/simulator/tessel/NativeProbe$ThrowingHandler")));
  EXPECT_EQ(host.ScalarGetOidVal(Scalar("1")), std::nullopt);
  EXPECT_FALSE(env_->ExceptionCheck());
  EXPECT_EQ(host.SetOidVal(Scalar("1", "still answers")),
            (Texts{"'7374696c6c20616e7377657273'h", "-1"}));
}

TEST_F(JniHostTest, EngineThreadAttachesOnceAndDetachesAtItsEnd) {
  JniHost& host = JniHost::Instance();
  int attachedDuring = -1;
  std::thread engineThread([&] {
    host.SetOidVal(Scalar("4", "from a thread"));
    HostAnswer answer = host.ScalarGetOidVal(Scalar("4"));
    EXPECT_EQ(answer, (Texts{"'66726f6d206120746872656164'h", "-1"}));
    attachedDuring = ThreadsNamed(AttachedEnv(vm_), "tessel-engine");
  });
  engineThread.join();
  EXPECT_EQ(attachedDuring, 1) << "two calls, one attachment";
  EXPECT_EQ(ThreadsNamed(env_, "tessel-engine"), 0);
}

TEST_F(JniHostTest, ScramblerGetsEveryArgumentInOrderAndItsTableIsReadWholeOrNotAtAll) {
  JniHost& host = JniHost::Instance();
  ASSERT_TRUE(host.BindSnmpHandler(
      env_, NewObject("com/kestrelon/simulator/tessel/NativeProbe$ScramblingHandler")));
  ScrambleQuery query;
  query.version = 1;
  query.community = "public";
  query.oids = {".1.3.6.1.2.1.1.5.0", ".1.3.6.1.2.1.1.3.0"};
  query.values = {"r1", std::nullopt};
  query.requestId = 4000000000;
  query.pduType = 0xA2;
  query.errorStatus = 2;
  query.errorIndex = 1;
  query.oidField = ".1.3.6";
  query.timeout = 5;
  query.retries = 1;
  query.agentAddress = "127.0.1.7";
  query.agentPort = 159;
  query.managerAddress = "127.0.0.9";
  query.isResponse = true;
  std::optional<ScrambleChanges> changes = host.ScramblePDU(query);
  ASSERT_TRUE(changes);
  EXPECT_EQ(
      changes->community,
      "1 public [.1.3.6.1.2.1.1.5.0, .1.3.6.1.2.1.1.3.0] [r1, null] 4000000000 -94 2 1 .1.3.6 "
      "5 1 127.0.1.7 159 127.0.0.9 true");
  EXPECT_EQ(changes->requestId, 5);
  EXPECT_EQ(changes->pduType, 0xA2);
  EXPECT_EQ(changes->oidField, ".1.3.6.1.4.1.99");
  EXPECT_EQ(changes->retries, 2);
  EXPECT_EQ(changes->errorStatus, std::nullopt);

  query.agentAddress = "wrong-type";
  EXPECT_EQ(host.ScramblePDU(query), std::nullopt);
  EXPECT_FALSE(env_->ExceptionCheck());
}

TEST_F(JniHostTest, Tl1HandlerAnswersAcknowledgmentAndResponseBlock) {
  ASSERT_EQ(env_->PushLocalFrame(64), 0);
  JniHost& host = JniHost::Instance();
  EXPECT_FALSE(host.BindTl1Handler(env_, simulator_)) << "an object without the TL1 methods";
  jobject handler = NewObject("com/kestrelon/simulator/tessel/tl1/TL1Handler");
  jclass dataType = env_->FindClass("com/kestrelon/simulator/tessel/tl1/TL1Data");
  jobject data = env_->CallStaticObjectMethod(
      dataType,
      env_->GetStaticMethodID(dataType, "parse",
                              "(Ljava/lang/String;Ljava/lang/String;)Lcom/kestrelon/simulator/"
                              "tessel/tl1/TL1Data;"),
      env_->NewStringUTF("probe"),
      env_->NewStringUTF("[ENT-EQPT]\nack IP\nCOMPLD\n\"{SID}:{AID}:{P1}:{CTAG}\"\n/*@{P2}*/\n"));
  ASSERT_FALSE(env_->ExceptionCheck());
  jclass listType = env_->FindClass("java/util/List");
  jobject users = env_->CallStaticObjectMethod(
      listType, env_->GetStaticMethodID(listType, "of", "()Ljava/util/List;"));
  ASSERT_FALSE(env_->ExceptionCheck());
  jclass handlerType = env_->GetObjectClass(handler);
  env_->CallVoidMethod(handler,
                       env_->GetMethodID(handlerType, "addDevice",
                                         "(ILjava/lang/String;Ljava/lang/String;Lcom/kestrelon/"
                                         "simulator/tessel/tl1/TL1Data;Ljava/util/List;)V"),
                       7, env_->NewStringUTF("NE1"), env_->NewStringUTF("g"), data, users);
  ASSERT_FALSE(env_->ExceptionCheck());
  ASSERT_TRUE(host.BindTl1Handler(env_, handler));

  Tl1HostQuery query;
  query.verb = "ENT";
  query.modifier1 = "EQPT";
  query.aidText = "SLOT-1";
  query.parameters = Texts{"x\xc3\xa9", std::nullopt};
  query.agentId = 7;
  query.agentAddress = "127.0.1.7";
  query.agentPort = 3083;
  query.hostText3 = "mode";
  EXPECT_EQ(host.Tl1GetAck(query), 1);
  EXPECT_EQ(host.Tl1GetResponseBlock(query), (Texts{"1", "0|NE1:SLOT-1:x\xc3\xa9:{CTAG}", "2|@"}));
  query.verb = "DLT";
  EXPECT_EQ(host.Tl1GetAck(query), 0);
  EXPECT_EQ(host.Tl1GetResponseBlock(query), (Texts{"ErrorCode", "SCNF", "COMMAND NOT FOUND"}));
  query.agentId = 8;
  EXPECT_EQ(host.Tl1GetResponseBlock(query), std::nullopt) << "a device the host does not serve";
  EXPECT_FALSE(env_->ExceptionCheck());
  env_->PopLocalFrame(nullptr);
}

}  // namespace
}  // namespace tessel
