# gbdt-demo: scores one feature vector with a model file.
# gbdt-samples: regenerates examples/demo/model.txt and the model reader's
# fuzz seeds with the model writer.
add_executable(gbdt-demo gbdt_demo.cc)
target_link_libraries(gbdt-demo PRIVATE gbdt double-conversion::double-conversion)

add_executable(gbdt-samples gbdt_samples.cc)
target_link_libraries(gbdt-samples PRIVATE gbdt)
