// The viewer's configuration for a server that has it under /viewer and DICOMweb under /dicom-web.
{
  const settings = {
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

  /// Whether the server takes objects, and from whoever is here.
  const mayStore = async () => {
    try {
      const answer = await fetch('/browser/config', { headers: { Accept: 'application/json' } });
      return answer.ok && (await answer.json()).may.includes('store');
    } catch (fault) {
      return false;
    }
  };

  // The viewer calls it when it begins; some of its parts look for settings in the function itself.
  window.config = Object.assign(async () => {
    settings.dataSources[0].configuration.dicomUploadEnabled = await mayStore();
    return settings;
  }, settings);
}
