# gbdt-samples: regenerates the model reader's fuzz seeds with the model
# writer.
add_executable(gbdt-samples gbdt_samples.cc)
target_link_libraries(gbdt-samples PRIVATE gbdt)
