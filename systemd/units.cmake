# The systemd units of the boot-time apply (docs/boot.md), configured with
# the installed hoxcfg and installed with it. HOXCM_SYSTEMD_UNIT_DIR is
# relative to the prefix unless absolute.
set(HOXCM_SYSTEMD_UNIT_DIR "lib/systemd/system" CACHE STRING "Where the systemd units are installed")
set(HOXCM_FIRSTBOOT_DOCUMENT "/etc/tarvik/autodeploy/firstboot.json")
set(HOXCM_UNITS hoxcm-boot.service hoxcm-bootstrap.service)

function(hoxcm_configure_units hoxcfg doc_dir out_dir)
  set(HOXCM_HOXCFG "${hoxcfg}")
  set(HOXCM_DOC_DIR "${doc_dir}")
  foreach(unit IN LISTS HOXCM_UNITS)
    configure_file(${PROJECT_SOURCE_DIR}/systemd/${unit}.in ${out_dir}/${unit} @ONLY)
  endforeach()
endfunction()

hoxcm_configure_units("${CMAKE_INSTALL_FULL_BINDIR}/hoxcfg" "${CMAKE_INSTALL_FULL_DOCDIR}"
                      "${CMAKE_BINARY_DIR}/systemd")
foreach(unit IN LISTS HOXCM_UNITS)
  install(FILES ${CMAKE_BINARY_DIR}/systemd/${unit} DESTINATION ${HOXCM_SYSTEMD_UNIT_DIR})
endforeach()
install(FILES ${PROJECT_SOURCE_DIR}/docs/boot.md DESTINATION ${CMAKE_INSTALL_DOCDIR})
