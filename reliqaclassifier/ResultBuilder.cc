#include "reliqaclassifier/ResultBuilder.h"

#include <utility>

#include "reliqaclassifier/ModelParamsPersistence.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

namespace kestrova::reliqaclassifier {

ReliqaClassifierResult buildResult(const thornvale::FeatureMap& features, const thornvale::BoostingModel* model,
                                   thornvale::CacheManager& modelParamsCache) {
  const double score = model ? model->predict(features) : 1.0;
  std::string modelId = fetchModelId(modelParamsCache);
  const double threshold = fetchThreshold(modelParamsCache);

  ReliqaClassifierResult result;
  result.score = score;
  result.isOverThreshold = score > threshold;
  result.loggingData.emplace(kScoreLoggingKey, thornvale::doubleToText(score));
  result.loggingData.emplace(kModelIdLoggingKey, std::move(modelId));
  result.loggingData.emplace(kFeatureVectorLoggingKey, thornvale::featureMapToJson(features));
  result.loggingData.emplace(kThresholdLoggingKey, thornvale::doubleToText(threshold));
  return result;
}

}  // namespace kestrova::reliqaclassifier
