target_sources(telvane_platform PRIVATE
  ${CMAKE_CURRENT_LIST_DIR}/Condition.cpp
  ${CMAKE_CURRENT_LIST_DIR}/CurrentQueues.cpp
  ${CMAKE_CURRENT_LIST_DIR}/Dispatch.cpp
  ${CMAKE_CURRENT_LIST_DIR}/FlowGate.cpp
  ${CMAKE_CURRENT_LIST_DIR}/Random.cpp
  ${CMAKE_CURRENT_LIST_DIR}/RepeatingTimer.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SystemClock.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SystemRandom.cpp
  ${CMAKE_CURRENT_LIST_DIR}/Thread.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ThreadedConcurrentQueue.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ThreadedDispatch.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ThreadedMonitor.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ThreadedSemaphore.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ThreadedSerialQueue.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ThreadedTimer.cpp
  ${CMAKE_CURRENT_LIST_DIR}/TimerService.cpp
  ${CMAKE_CURRENT_LIST_DIR}/WorkerPool.cpp
)
target_link_libraries(telvane_platform PRIVATE Threads::Threads)
