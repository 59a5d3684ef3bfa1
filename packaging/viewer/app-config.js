// The viewer's configuration for a server that has it under /viewer and DICOMweb under /dicom-web.
window.config = {
  routerBasename: '/viewer',
  extensions: [],
  modes: [],
  customizationService: {},
  showStudyList: true,
  maxNumberOfWebWorkers: 3,
  showWarningMessageForCrossOrigin: false,
  showCPUFallbackMessage: false,
  showLoadingIndicator: true,
  strictZSpacingForVolumeViewport: true,
  maxNumRequests: { interaction: 100, thumbnail: 75, prefetch: 25 },
  // Both cover the picture.
  investigationalUseDialog: { option: 'never' },
  disableConfirmationPrompts: true,
  defaultDataSourceName: 'dicomweb',
  dataSources: [
    {
      namespace: '@ohif/extension-default.dataSourcesModule.dicomweb',
      sourceName: 'dicomweb',
      configuration: {
        friendlyName: 'This archive',
        name: 'archive',
        wadoUriRoot: window.location.origin + '/wado',
        qidoRoot: window.location.origin + '/dicom-web',
        wadoRoot: window.location.origin + '/dicom-web',
        qidoSupportsIncludeField: true,
        supportsReject: false,
        supportsFuzzyMatching: true,
        supportsWildcard: true,
        imageRendering: 'wadors',
        thumbnailRendering: 'thumbnail',
        enableStudyLazyLoad: true,
        singlepart: 'bulkdata,video,pdf',
        bulkDataURI: { enabled: true },
        // A quote in Accept costs a browser on another origin one more request for each frame.
        omitQuotationForMultipartRequest: true,
      },
    },
  ],
};
