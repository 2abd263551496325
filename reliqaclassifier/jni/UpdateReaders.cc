#include "reliqaclassifier/jni/UpdateReaders.h"

#include <string>

#include <glog/logging.h>

#include "host/jni/Environment.h"
#include "host/jni/Exceptions.h"
#include "host/jni/Lookup.h"
#include "host/jni/References.h"
#include "host/jni/Strings.h"
#include "reliqaclassifier/jni/ManagedClasses.h"
#include "reliqaclassifier/jni/NullChecks.h"
#include "reliqaclassifier/ServerFeatureText.h"

namespace kestrova::reliqaclassifier {
namespace {

using jni::GlobalRef;
using jni::LocalRef;

struct ModelParamsFields {
  jfieldID serializedModel, modelId, threshold;

  static const ModelParamsFields& get() {
    static const ModelParamsFields fields = [] {
      LocalRef<jclass> cls = jni::findClassLocal(managed::kModelParams);
      ModelParamsFields f;
      f.serializedModel = jni::getFieldId(cls.get(), "mSerializedModel", managed::kStringType);
      f.modelId = jni::getFieldId(cls.get(), "mModelId", managed::kStringType);
      f.threshold = jni::getFieldId(cls.get(), "mThreshold", "D");
      return f;
    }();
    return fields;
  }
};

struct MapIteratorHelperMembers {
  jclass cls;
  jmethodID constructor, hasNext;
  jfieldID key, value;

  static const MapIteratorHelperMembers& get() {
    static const MapIteratorHelperMembers members = [] {
      MapIteratorHelperMembers m;
      m.cls = jni::findClassStatic(managed::kMapIteratorHelper);
      m.constructor = jni::getMethodId(m.cls, "<init>", "(Ljava/util/Map;)V");
      m.hasNext = jni::getMethodId(m.cls, "hasNext", "()Z");
      m.key = jni::getFieldId(m.cls, "mKey", "Ljava/lang/Object;");
      m.value = jni::getFieldId(m.cls, "mValue", "Ljava/lang/Object;");
      return m;
    }();
    return members;
  }
};

jfieldID featuresField() {
  static const jfieldID field = jni::getFieldId(
      jni::findClassLocal(managed::kServerFeatures).get(), "features", "Ljava/util/Map;");
  return field;
}

std::string readString(JNIEnv* env, jobject object, jfieldID field, const char* what) {
  LocalRef<jstring> text(static_cast<jstring>(env->GetObjectField(object, field)));
  if (!text) {
    throwNullPointer(what);
  }
  return jni::JString(text.get()).toStdString();
}

jclass stringClass() {
  static const jclass cls = [] {
    JNIEnv* env = jni::Environment::current();
    LocalRef<jclass> local(env->FindClass("java/lang/String"));
    if (!local) {
      env->ExceptionClear();
      jni::throwNewJavaException("java/lang/ClassCastException", "Could not find class %s.",
                                 "java/lang/String");
    }
    return static_cast<jclass>(GlobalRef<jclass>::make(env, local.get()).release());
  }();
  return cls;
}

// `object` as a java.lang.String (null stays null), or ClassCastException.
LocalRef<jstring> castToString(LocalRef<jobject> object) {
  if (!object) {
    return LocalRef<jstring>();
  }
  JNIEnv* env = jni::Environment::current();
  if (!env->IsInstanceOf(object.get(), stringClass())) {
    static const jmethodID toString = jni::getMethodId(
        jni::findClassLocal("java/lang/Object").get(), "toString", "()Ljava/lang/String;");
    LocalRef<jclass> cls(env->GetObjectClass(object.get()));
    LocalRef<jstring> name(static_cast<jstring>(env->CallObjectMethod(cls.get(), toString)));
    jni::throwCppExceptionIf(!name);
    jni::throwNewJavaException("java/lang/ClassCastException", "Tried to cast from %s to %s.",
                               jni::JString(name.get()).toStdString().c_str(), "java/lang/String");
  }
  return LocalRef<jstring>(static_cast<jstring>(object.release()));
}

}  // namespace

ReliqaClassifierModelParams readModelParams(jobject params) {
  if (params == nullptr) {
    throwNullPointer("ReliqaClassifierModelParams");
  }
  JNIEnv* env = jni::Environment::current();
  const auto& f = ModelParamsFields::get();
  ReliqaClassifierModelParams record;
  record.mSerializedModel =
      readString(env, params, f.serializedModel, "ReliqaClassifierModelParams.mSerializedModel");
  record.mModelId = readString(env, params, f.modelId, "ReliqaClassifierModelParams.mModelId");
  record.mThreshold = env->GetDoubleField(params, f.threshold);
  return record;
}

thornvale::FeatureMap readServerFeatures(jobject serverFeatures) {
  if (serverFeatures == nullptr) {
    throwNullPointer("ReliqaClassifierServerFeatures");
  }
  JNIEnv* env = jni::Environment::current();
  LocalRef<jobject> map(env->GetObjectField(serverFeatures, featuresField()));
  if (!map) {
    throwNullPointer("ReliqaClassifierServerFeatures.features");
  }

  thornvale::FeatureMap features;
  const auto& m = MapIteratorHelperMembers::get();
  GlobalRef<jobject> iterator;
  {
    LocalRef<jobject> local(env->NewObject(m.cls, m.constructor, map.get()));
    jni::throwCppExceptionIf(!local);
    iterator = GlobalRef<jobject>::make(env, local.get());
  }
  for (;;) {
    jboolean more = env->CallBooleanMethod(iterator.get(), m.hasNext);
    jni::throwPendingJniExceptionAsCppException();
    if (!more) {
      break;
    }
    LocalRef<jstring> key = castToString(LocalRef<jobject>(env->GetObjectField(iterator.get(), m.key)));
    LocalRef<jstring> value =
        castToString(LocalRef<jobject>(env->GetObjectField(iterator.get(), m.value)));
    if (!value) {
      jni::throwNewJavaException("java/lang/NullPointerException",
                                 "ReliqaClassifierServerFeatures.features has a null value");
    }
    double number = parseFeatureValue(jni::JString(value.get()).toStdString());
    if (!key) {
      jni::throwNewJavaException("java/lang/NullPointerException",
                                 "ReliqaClassifierServerFeatures.features has a null key");
    }
    std::string keyText = jni::JString(key.get()).toStdString();
    if (std::optional<int32_t> id = parseFeatureId(keyText)) {
      features.emplace(*id, number);
    } else {
      LOG(WARNING) << "server feature key \"" << keyText
                   << "\" is outside the range of feature ids; dropped";
    }
  }
  return features;
}

}  // namespace kestrova::reliqaclassifier
